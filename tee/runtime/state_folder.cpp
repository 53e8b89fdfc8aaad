#include "tee/runtime/state_folder.h"

#include <fcntl.h>
#include <openssl/rand.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <system_error>

#include "tee/runtime/hex.h"
#include "tee/runtime/platform_call.h"
#include "tee/runtime/property.h"
#include "tee/runtime/secure_world.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

constexpr unsigned layout_version = 1;

using preparation = std::function<void(const device_record&)>;

[[noreturn]] void corrupt(const std::filesystem::path& file, const std::string& why) {
  throw world_error(world_fault::corrupt, file.string() + ": " + why);
}

[[noreturn]] void malformed(const std::filesystem::path& file, const std::string& why) {
  throw world_error(world_fault::malformed, file.string() + ": " + why);
}

bool belongs_before_the_version(const std::filesystem::path& name) {
  // A person may write settings first, and the others are what a crash of the very first start leaves.
  return name == "lock" || name == "settings" || name == "version.tee-new";
}

// What a person keeps in a folder must not be mixed with a device's state: leftovers are deleted by their names. Looked
// at without the lock, which would be a file there already.
void refuse_foreign(const std::filesystem::path& folder) {
  const std::filesystem::path version = folder / "version";
  if (std::filesystem::exists(version)) return;
  const std::filesystem::directory_iterator entries(folder);
  const bool is_foreign = std::any_of(begin(entries), end(entries), [](const auto& entry) {
    return !belongs_before_the_version(entry.path().filename());
  });
  if (!is_foreign || std::filesystem::exists(version)) return;  // another process may just make it
  if (std::filesystem::exists(folder / "device")) corrupt(version, "it is missing beside a device");
  throw world_error(world_fault::foreign, folder.string() + " is neither empty nor a device's state");
}

file_descriptor take_lock(const std::filesystem::path& folder) {
  const std::filesystem::path file = folder / "lock";
  file_descriptor lock(::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock.is_open()) throw std::system_error(errno, std::generic_category(), file.string());
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno == EWOULDBLOCK) throw world_error(world_fault::busy, folder.string() + " is in use by another process");
    throw std::system_error(errno, std::generic_category(), file.string());
  }
  return lock;
}

std::string_view trimmed(std::string_view text) {
  constexpr std::string_view blanks = " \t\r\n";
  const std::size_t first = text.find_first_not_of(blanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

// The version is written before anything that depends on it.
void check_version(const std::filesystem::path& folder, const step_observer& step) {
  const std::filesystem::path file = folder / "version";
  const std::optional<std::string> content = read_file(file);
  if (!content) {
    write_durably(file, std::to_string(layout_version) + "\n", step);
    return;
  }
  const std::string_view text = trimmed(*content);
  unsigned version = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), version);
  if (error != std::errc() || end != text.data() + text.size() || version == 0) malformed(file, "not a version number");
  if (version > layout_version) {
    throw world_error(world_fault::newer, folder.string() + " was written by a newer version");
  }
}

// Whether a message may repeat what a file says.
enum class content { open, secret };

// Calls `take(name, value)` for each `name = value` line; `take` answers whether it knows the two.
template <class Take>
void read_lines(const std::filesystem::path& file, std::string_view text, content kind, Take&& take) {
  for (unsigned number = 1; !text.empty(); ++number) {
    const std::size_t end = text.find('\n');
    const std::string_view line = trimmed(text.substr(0, end));
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    if (line.empty() || line.front() == '#') continue;
    const std::size_t equals = line.find('=');
    const bool known =
        equals != std::string_view::npos && take(trimmed(line.substr(0, equals)), trimmed(line.substr(equals + 1)));
    if (known) continue;
    const std::string where = "can't make sense of line " + std::to_string(number);
    malformed(file, kind == content::secret ? where : where + ": " + std::string(line));
  }
}

std::string_view as_text(const secret_bytes& bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

void append(secret_bytes& text, std::string_view part) {
  text.insert(text.end(), part.begin(), part.end());
}

device_record make_device(const std::filesystem::path& file, const step_observer& step, const preparation& prepare) {
  device_record device{random_uuid(), {}};
  if (RAND_bytes(device.key.bytes().data(), static_cast<int>(device.key.bytes().size())) != 1) {
    throw world_error(world_fault::io, "libcrypto has no random bytes");
  }
  prepare(device);
  secret_bytes text;
  append(text, "device-id = " + to_text(device.id) + "\nstorage-key = ");
  append_hex(text, device.key.bytes());
  append(text, "\n");
  write_durably(file, as_text(text), step);
  return device;
}

device_record load_device(const std::filesystem::path& folder, const step_observer& step, const preparation& prepare) {
  const std::filesystem::path file = folder / "device";
  const std::optional<secret_bytes> text = read_secret(file);
  if (!text) return make_device(file, step, prepare);
  std::optional<TEE_UUID> id;
  std::optional<storage_key> key;
  read_lines(file, as_text(*text), content::secret, [&](std::string_view name, std::string_view value) {
    if (name == "device-id") return (id = parse_uuid(value)).has_value();
    return name == "storage-key" && from_hex(value, key.emplace().bytes());
  });
  if (!id || !key) malformed(file, "the identity or the storage key is missing");
  return {*id, *key};
}

// Of two lines for one thing neither is what the person meant for sure: the second is refused.
bool take_setting(device_settings& settings, std::string_view name, std::string_view value) {
  if (name == "rpmb") {
    if (settings.rpmb) return false;
    settings.rpmb = value == "on";
    return value == "on" || value == "off";
  }
  if (name == "device-id") return !settings.device_id && (settings.device_id = parse_uuid(value)).has_value();
  return is_settable_property(name) && settings.text_properties.emplace(name, value).second;
}

device_settings load_settings(const std::filesystem::path& folder) {
  const std::filesystem::path file = folder / "settings";
  device_settings settings;
  read_lines(file, read_file(file).value_or(""), content::open,
             [&](std::string_view name, std::string_view value) { return take_setting(settings, name, value); });
  return settings;
}

}  // namespace

state_folder::state_folder(const std::filesystem::path& path, const step_observer& step, const preparation& prepare)
    : path_(path) {
  try {
    make_folder(path_);
    refuse_foreign(path_);
    lock_ = take_lock(path_);
    check_version(path_, step);
    remove_leftovers(path_);
    device_ = load_device(path_, step, prepare);
    settings_ = load_settings(path_);
  } catch (const std::system_error& error) {
    throw world_error(world_fault::io, error.what());
  } catch (const call_failure&) {
    throw world_error(world_fault::io, path_.string() + " can't be written");
  }
}

}  // namespace hosted_tee
