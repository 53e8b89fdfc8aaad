// The code of a TA: loaded from `<uuid>.ta`, or linked into the program.
#ifndef TEE_RUNTIME_TA_IMAGE_H_
#define TEE_RUNTIME_TA_IMAGE_H_

#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>
#include <vector>

#include "tee/runtime/builtin_ta.h"
#include "tee/runtime/file_descriptor.h"

namespace hosted_tee {

/// One instance's own copy of an image. Every load starts with fresh static data, and unloading ends it.
class ta_image {
 public:
  /// of_builtin wraps a TA that is part of the program.
  explicit ta_image(const builtin_ta& parts) : parts_(parts) {}

  /// Loads the image at `file`. Throws std::runtime_error with the loader's own words.
  explicit ta_image(const std::filesystem::path& file);
  ~ta_image();
  ta_image(const ta_image&) = delete;
  ta_image& operator=(const ta_image&) = delete;

  [[nodiscard]] const builtin_ta& parts() const { return parts_; }
  [[nodiscard]] std::optional<bool> bool_property(std::string_view name) const;
  [[nodiscard]] std::optional<std::uint32_t> number_property(std::string_view name) const;

 private:
  [[nodiscard]] const tee_ta_property* property(std::string_view name, std::uint32_t type) const;

  file_descriptor memory_;
  void* library_ = nullptr;
  builtin_ta parts_{};
};

/// find_ta finds the code of `ta`: a built-in TA, or the first `<uuid>.ta` in `folders`. Null when there is none.
/// Throws std::runtime_error when what is there is not an image of that TA.
[[nodiscard]] std::unique_ptr<ta_image> find_ta(const TEE_UUID& ta, const std::vector<std::filesystem::path>& folders);

/// default_ta_folders: those of KEYMASTER_TA_PATH (separated by colons), else `keymaster/ta` in the folder that this
/// library was loaded from. So every program finds the images that belong to its library, wherever both were moved to.
[[nodiscard]] std::vector<std::filesystem::path> default_ta_folders();

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_TA_IMAGE_H_
