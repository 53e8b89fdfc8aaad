#include "tee/storage/rollback_guard.h"

#include <algorithm>
#include <exception>
#include <span>
#include <string>
#include <system_error>

#include "tee/runtime/platform_call.h"

namespace hosted_tee {
namespace {

constexpr std::string_view label = "rpmb counter";
constexpr std::size_t state_size = 8 + 32;

void append(std::string& out, const database_state& state) {
  for (unsigned shift = 0; shift < 64; shift += 8) out.push_back(static_cast<char>(state.counter >> shift));
  out.append(state.digest.begin(), state.digest.end());
}

database_state parse(std::span<const std::uint8_t, state_size> bytes) {
  database_state state;
  for (unsigned i = 0; i < 8; ++i) state.counter |= std::uint64_t{bytes[i]} << (8 * i);
  std::copy(bytes.begin() + 8, bytes.end(), state.digest.begin());
  return state;
}

std::span<const std::uint8_t> bytes_of(const std::string& text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

}  // namespace

rollback_guard::rollback_guard(std::filesystem::path file, const storage_key& key, step_observer step)
    : file_(std::move(file)), sealer_(key), step_(std::move(step)) {}

std::optional<rollback_guard::record> rollback_guard::read() const {
  const std::optional<std::string> sealed = read_file(file_);
  if (!sealed) return std::nullopt;
  const std::optional<secret_bytes> plain = sealer_.open(label, bytes_of(*sealed));
  if (!plain || (plain->size() != state_size && plain->size() != 2 * state_size)) {
    throw call_failure(TEE_ERROR_SECURITY);
  }
  const std::span<const std::uint8_t> all(*plain);
  record content{parse(all.first<state_size>()), std::nullopt};
  if (plain->size() == 2 * state_size) content.announced = parse(all.last<state_size>());
  return content;
}

void rollback_guard::write(const record& content) const {
  std::string plain;
  append(plain, content.settled);
  if (content.announced) append(plain, *content.announced);
  const std::vector<std::uint8_t> sealed = sealer_.seal(label, bytes_of(plain));
  try {
    write_durably(file_, {reinterpret_cast<const char*>(sealed.data()), sealed.size()}, step_);
  } catch (const std::system_error& error) {
    const bool full = error.code() == std::errc::no_space_on_device;
    throw call_failure(full ? TEE_ERROR_STORAGE_NO_SPACE : TEE_ERROR_STORAGE_NOT_AVAILABLE);
  }
}

void rollback_guard::start(const database_state& empty) {
  write({empty, std::nullopt});
}

bool rollback_guard::accept(const database_state& state) {
  const std::optional<record> content = read();
  if (!content || (state != content->settled && state != content->announced)) return false;
  if (content->announced) write({state, std::nullopt});
  settled_ = state;
  return true;
}

void rollback_guard::announce(const database_state& next) {
  write({settled_, next});
}

// The database has been written by now. When the file can't be, the announcement in it still covers this state, and the
// next announcement starts from it.
void rollback_guard::settle(const database_state& reached) noexcept {
  settled_ = reached;
  try {
    write({settled_, std::nullopt});
  } catch (const std::exception&) {
  }
}

}  // namespace hosted_tee
