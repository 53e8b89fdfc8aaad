#include "tee/storage/persistent_object.h"

#include <algorithm>
#include <utility>

namespace hosted_tee {

bool may_open(object_store& store, const object_key& key, std::uint32_t flags) {
  std::vector<std::uint32_t> handles = store.handles_on(key);
  if (handles.empty()) return true;
  handles.push_back(flags);
  const auto any = [&](std::uint32_t flag) {
    return std::any_of(handles.begin(), handles.end(), [&](std::uint32_t f) { return (f & flag) != 0; });
  };
  const auto all = [&](std::uint32_t flag) {
    return std::all_of(handles.begin(), handles.end(), [&](std::uint32_t f) { return (f & flag) != 0; });
  };
  if (any(TEE_DATA_FLAG_ACCESS_WRITE_META)) return false;
  if (any(TEE_DATA_FLAG_ACCESS_READ) && !all(TEE_DATA_FLAG_SHARE_READ)) return false;
  return !any(TEE_DATA_FLAG_ACCESS_WRITE) || all(TEE_DATA_FLAG_SHARE_WRITE);
}

persistent_object::persistent_object(object_store& store, object_key key, std::uint32_t flags)
    : store_(store), key_(std::move(key)), flags_(flags) {
  store_.add_handle(key_, flags_);
}

persistent_object::~persistent_object() {
  store_.forget_handle(key_, flags_);
}

std::uint32_t persistent_object::size() const {
  const std::optional<std::uint32_t> size = store_.size(key_);
  if (!size) throw call_failure(TEE_ERROR_CORRUPT_OBJECT);
  return *size;
}

TEE_ObjectInfo persistent_object::info() const {
  TEE_ObjectInfo info{};
  info.objectType = TEE_TYPE_DATA;
  info.objectUsage = 0xFFFFFFFF;
  info.dataSize = size();
  info.dataPosition = position_;
  info.handleFlags = flags_ | TEE_HANDLE_FLAG_PERSISTENT | TEE_HANDLE_FLAG_INITIALIZED;
  return info;
}

secret_bytes persistent_object::content() const {
  std::optional<secret_bytes> data = store_.read(key_);
  // Nobody can remove an object under an open handle, except who tampers with the storage.
  if (!data) throw call_failure(TEE_ERROR_CORRUPT_OBJECT);
  return std::move(*data);
}

std::uint32_t persistent_object::read(std::span<std::uint8_t> buffer) {
  const secret_bytes data = content();
  if (position_ >= data.size()) return 0;
  const auto count = static_cast<std::uint32_t>(std::min(buffer.size(), data.size() - position_));
  std::copy_n(data.begin() + position_, count, buffer.begin());
  position_ += count;
  return count;
}

void persistent_object::write(std::span<const std::uint8_t> data) {
  const std::uint64_t end = std::uint64_t{position_} + data.size();
  if (end > TEE_DATA_MAX_POSITION) throw call_failure(TEE_ERROR_OVERFLOW);
  if (end > object_store::max_object_size) throw call_failure(TEE_ERROR_STORAGE_NO_SPACE);
  if (data.empty()) return;
  secret_bytes all = content();
  all.resize(std::max(all.size(), static_cast<std::size_t>(end)));
  std::copy(data.begin(), data.end(), all.begin() + position_);
  store_.write(key_, all);
  position_ = static_cast<std::uint32_t>(end);
}

void persistent_object::truncate(std::uint32_t size) {
  if (size > object_store::max_object_size) throw call_failure(TEE_ERROR_STORAGE_NO_SPACE);
  secret_bytes all = content();
  all.resize(size);
  store_.write(key_, all);
}

void persistent_object::seek(std::int64_t position) {
  if (position > std::int64_t{TEE_DATA_MAX_POSITION}) throw call_failure(TEE_ERROR_OVERFLOW);
  position_ = static_cast<std::uint32_t>(std::max<std::int64_t>(position, 0));
}

void persistent_object::rename(const std::string& new_id) {
  if (store_.contains({key_.ta, new_id})) throw call_failure(TEE_ERROR_ACCESS_CONFLICT);
  store_.rename(key_, new_id);
  store_.forget_handle(key_, flags_);
  key_.id = new_id;
  store_.add_handle(key_, flags_);
}

void persistent_object::remove() {
  store_.remove(key_);
}

}  // namespace hosted_tee
