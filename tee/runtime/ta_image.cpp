#include "tee/runtime/ta_image.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/sendfile.h>

#include <cerrno>
#include <cstdlib>
#include <mutex>
#include <stdexcept>
#include <system_error>

#include "tee/runtime/device_information.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

std::vector<builtin_ta>& builtin_tas() {
  static std::vector<builtin_ta> tas{device_information_ta()};
  return tas;
}

std::mutex& builtin_mutex() {
  static std::mutex mutex;
  return mutex;
}

struct unloader {
  void operator()(void* loaded) const { dlclose(loaded); }
};
using library = std::unique_ptr<void, unloader>;

std::string path_of(const file_descriptor& fd) {
  return "/proc/self/fd/" + std::to_string(fd.get());
}

// The file that this library was loaded from, as the loader names it.
const char* own_file() {
  Dl_info self{};
  return dladdr(reinterpret_cast<void*>(&tee_entry_open_session), &self) == 0 ? nullptr : self.dli_fname;
}

// The folder of that file, without links, whatever the loader's search path called it.
std::filesystem::path own_folder() {
  const char* file = own_file();
  std::error_code lost;
  return file == nullptr ? std::filesystem::path() : std::filesystem::canonical(file, lost).parent_path();
}

// An image takes the platform's calls from the program's global scope. A program that loaded this library as a plug-in
// has it in a scope of its own until it is asked for again.
void enter_global_scope() {
  static const bool entered = [] {
    const char* file = own_file();
    return file != nullptr && dlopen(file, RTLD_NOW | RTLD_NOLOAD | RTLD_GLOBAL) != nullptr;
  }();
  (void)entered;  // what is missing shows when the image is bound
}

// The kernel copies: an image may carry debugging information many times its own size, which nobody looks at here.
file_descriptor copy_to_memory(const std::filesystem::path& file) {
  constexpr std::size_t most_at_once = std::size_t{1} << 30;
  const file_descriptor source(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  file_descriptor memory(memfd_create(file.filename().c_str(), MFD_CLOEXEC));
  ssize_t copied = source.is_open() && memory.is_open() ? 1 : -1;
  while (copied > 0 || (copied < 0 && errno == EINTR)) {
    copied = ::sendfile(memory.get(), source.get(), nullptr, most_at_once);
  }
  if (copied < 0) throw std::system_error(errno, std::generic_category(), "copying the image");
  return memory;
}

// dlsym answers functions and data alike as void*.
template <class T>
void look_up(void* image, const char* name, T& out) {
  void* address = dlsym(image, name);
  if (address == nullptr) throw std::runtime_error(std::string("the image does not define ") + name);
  out = reinterpret_cast<T>(address);
}

}  // namespace

void register_builtin_ta(const builtin_ta& ta) {
  const std::scoped_lock lock(builtin_mutex());
  for (builtin_ta& known : builtin_tas()) {
    if (same_uuid(known.head->uuid, ta.head->uuid)) {
      known = ta;
      return;
    }
  }
  builtin_tas().push_back(ta);
}

ta_image::ta_image(const std::filesystem::path& file) : memory_(copy_to_memory(file)) {
  enter_global_scope();
  library loaded(dlopen(path_of(memory_).c_str(), RTLD_NOW | RTLD_LOCAL));
  if (loaded == nullptr) throw std::runtime_error(dlerror());
  look_up(loaded.get(), "ta_head", parts_.head);
  look_up(loaded.get(), "ta_properties", parts_.properties);
  look_up(loaded.get(), "tee_trace_prefix", parts_.trace_prefix);
  look_up(loaded.get(), "TA_CreateEntryPoint", parts_.create);
  look_up(loaded.get(), "TA_DestroyEntryPoint", parts_.destroy);
  look_up(loaded.get(), "TA_OpenSessionEntryPoint", parts_.open_session);
  look_up(loaded.get(), "TA_CloseSessionEntryPoint", parts_.close_session);
  look_up(loaded.get(), "TA_InvokeCommandEntryPoint", parts_.invoke);
  library_ = loaded.release();
}

// The loader knows images by their path. Where it keeps one (it may, after dlclose), the descriptor stays open too, so
// that the path is not given to the next image.
ta_image::~ta_image() {
  if (library_ == nullptr) return;
  dlclose(library_);
  if (const library kept{dlopen(path_of(memory_).c_str(), RTLD_NOW | RTLD_NOLOAD)}) memory_.release();
}

const tee_ta_property* ta_image::property(std::string_view name, std::uint32_t type) const {
  for (const tee_ta_property* p = parts_.properties; p != nullptr && p->name != nullptr; ++p) {
    if (name == p->name && p->type == type) return p;
  }
  return nullptr;
}

std::optional<bool> ta_image::bool_property(std::string_view name) const {
  const tee_ta_property* found = property(name, TEE_TA_PROPERTY_BOOL);
  return found == nullptr ? std::nullopt : std::optional(found->number != 0);
}

std::optional<std::uint32_t> ta_image::number_property(std::string_view name) const {
  const tee_ta_property* found = property(name, TEE_TA_PROPERTY_U32);
  return found == nullptr ? std::nullopt : std::optional(found->number);
}

std::unique_ptr<ta_image> find_ta(const TEE_UUID& ta, const std::vector<std::filesystem::path>& folders) {
  {
    const std::scoped_lock lock(builtin_mutex());
    for (const builtin_ta& known : builtin_tas()) {
      if (same_uuid(known.head->uuid, ta)) return std::make_unique<ta_image>(known);
    }
  }
  for (const std::filesystem::path& folder : folders) {
    const std::filesystem::path file = folder / (to_text(ta) + ".ta");
    if (!std::filesystem::is_regular_file(file)) continue;
    auto image = std::make_unique<ta_image>(file);
    const TEE_UUID named = image->parts().head->uuid;
    if (!same_uuid(named, ta)) throw std::runtime_error("the image is that of " + to_text(named));
    return image;
  }
  return nullptr;
}

std::vector<std::filesystem::path> default_ta_folders() {
  const char* path = std::getenv("KEYMASTER_TA_PATH");
  if (path == nullptr || *path == '\0') {
    const std::filesystem::path own = own_folder();
    if (own.empty()) return {};  // a relative path would be one of the caller's current folder
    return {own / HOSTED_TEE_TA_FOLDER};
  }
  std::vector<std::filesystem::path> folders;
  std::string_view rest = path;
  for (;;) {
    const std::size_t colon = rest.find(':');
    if (colon != 0 && !rest.empty()) folders.emplace_back(rest.substr(0, colon));
    if (colon == std::string_view::npos) return folders;
    rest.remove_prefix(colon + 1);
  }
}

}  // namespace hosted_tee
