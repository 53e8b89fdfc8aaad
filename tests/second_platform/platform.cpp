#include "tests/second_platform/platform.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>

#include "ta/ta_limits.h"

using namespace testing_support;

namespace second_platform {

platform_state platform;

namespace {

constexpr std::uint32_t margin = 16;
constexpr std::uint8_t margin_byte = 0xFD;
constexpr std::size_t shown_whole = 16;

std::uint32_t charge(std::uint32_t size) {
  return (size + 7) / 8 * 8 + 16;
}

template <class Handle, class Value>
Handle insert(std::map<const void*, std::unique_ptr<Value>>& held, Value value) {
  auto made = std::make_unique<Value>(std::move(value));
  const auto handle = reinterpret_cast<Handle>(made.get());
  held.emplace(made.get(), std::move(made));
  return handle;
}

}  // namespace

std::string shown(const bytes& data) {
  return data.size() > shown_whole ? fmt::format("[{}]", data.size()) : fmt::format("[{}]", to_hex(data));
}

bytes fixed_output(std::size_t size) {
  return pattern(size, 0x5E);
}

void platform_state::power_on() {
  *this = platform_state{};
}

void platform_state::clear() {
  calls_.clear();
  errors_.clear();
  heap_calls_ = 0;
}

std::vector<std::string> platform_state::names() const {
  std::vector<std::string> names;
  for (const std::string& call : calls_) names.push_back(call.substr(0, call.find('(')));
  return names;
}

const std::vector<std::string>& platform_state::violations() {
  for (const auto& [address, held] : blocks_) check_margins(held);
  return violations_;
}

holdings platform_state::held() const {
  return {blocks_.size(), objects_.size(), operations_.size(), sessions_};
}

void platform_state::answer(std::string_view function, std::uint32_t nth, const twist& departure) {
  const auto count = counts_.find(function);
  const std::uint32_t so_far = count == counts_.end() ? 0 : count->second;
  departures_[{std::string{function}, nth == 0 ? 0 : so_far + nth}] = departure;
}

twist platform_state::enter(const char* function, const std::string& arguments) {
  calls_.push_back(fmt::format("{}({})", function, arguments));
  const std::uint32_t count = ++counts_[function];
  for (const std::uint32_t nth : {count, 0U}) {
    if (const auto found = departures_.find({function, nth}); found != departures_.end()) return found->second;
  }
  return {};
}

TEE_Result platform_state::deliver(const twist& departure, const bytes& content, void* place, std::uint32_t* length) {
  const std::uint32_t capacity = *length;
  TEE_Result result = TEE_SUCCESS;
  if (!departure.undone) {
    check_range(place, capacity, "room for output");
    *length = static_cast<std::uint32_t>(content.size());
    if (content.size() > capacity) {
      result = TEE_ERROR_SHORT_BUFFER;
    } else if (!content.empty()) {
      std::memcpy(place, content.data(), content.size());
    }
  }
  if (departure.beyond_capacity && !departure.second_length) {
    *length = std::max(capacity + *departure.beyond_capacity, *departure.beyond_capacity);
  }
  return departure.result.value_or(result);
}

bytes platform_state::read(const void* data, std::uint32_t size) {
  check_range(data, size, "input");
  if (size == 0 || !violations_.empty()) return {};
  const auto* const first = static_cast<const std::uint8_t*>(data);
  return {first, first + size};
}

void platform_state::check_range(const void* data, std::uint32_t size, const char* what) {
  if (data == nullptr && size != 0) violations_.push_back(fmt::format("{}: null, {} bytes", what, size));
  const auto* const first = static_cast<const std::uint8_t*>(data);
  auto next = blocks_.upper_bound(first);
  if (first == nullptr || next == blocks_.begin()) return;
  const auto& [address, held] = *std::prev(next);
  const auto offset = static_cast<std::size_t>(first - address);
  if (offset <= held.size && size > held.size - offset) {
    violations_.push_back(fmt::format("{}: {} bytes at {} of a block of {}", what, size, offset, held.size));
  }
}

void* platform_state::allocate(std::uint32_t size) {
  ++heap_calls_;
  if (size > keymaster::ta_heap_size || charge(size) > keymaster::ta_heap_size - heap_bytes_) return nullptr;
  block made{std::make_unique<std::uint8_t[]>(size + 2 * margin), size};
  std::memset(made.memory.get(), margin_byte, margin);
  std::memset(made.memory.get() + margin + size, margin_byte, margin);
  std::uint8_t* const address = made.memory.get() + margin;
  heap_bytes_ += charge(size);
  heap_peak_ = std::max(heap_peak_, heap_bytes_);
  blocks_.emplace(address, std::move(made));
  return address;
}

void* platform_state::grow(void* address, std::uint32_t size) {
  void* const larger = allocate(size);
  const auto old = blocks_.find(static_cast<const std::uint8_t*>(address));
  if (larger == nullptr || old == blocks_.end()) return larger;
  std::memcpy(larger, address, std::min(size, old->second.size));
  free(address);
  return larger;
}

void platform_state::free(void* address) {
  ++heap_calls_;
  if (address == nullptr) return;
  const auto found = blocks_.find(static_cast<const std::uint8_t*>(address));
  if (found == blocks_.end()) {
    violations_.emplace_back("TEE_Free of no block");
    return;
  }
  check_margins(found->second);
  heap_bytes_ -= charge(found->second.size);
  blocks_.erase(found);
}

void platform_state::check_margins(const block& checked) {
  const std::uint8_t* const memory = checked.memory.get();
  const auto is_margin = [](std::uint8_t byte) { return byte == margin_byte; };
  const std::uint8_t* const behind = memory + margin + checked.size;
  if (!std::all_of(memory, memory + margin, is_margin) || !std::all_of(behind, behind + margin, is_margin)) {
    violations_.push_back(fmt::format("a write outside a block of {}", checked.size));
  }
}

void platform_state::trace(int level, std::string text) {
  if (level == TEE_TRACE_ERROR) errors_.push_back(std::move(text));
}

bytes platform_state::random(std::uint32_t size) {
  return pattern(size, ++randoms_);
}

object* platform_state::find(TEE_ObjectHandle handle) {
  if (handle == TEE_HANDLE_NULL) return nullptr;
  const auto found = objects_.find(handle);
  if (found != objects_.end()) return found->second.get();
  violations_.emplace_back("an object's handle that nobody holds");
  return nullptr;
}

operation* platform_state::find(TEE_OperationHandle handle) {
  if (handle == TEE_HANDLE_NULL) return nullptr;
  const auto found = operations_.find(handle);
  if (found != operations_.end()) return found->second.get();
  violations_.emplace_back("an operation's handle that nobody holds");
  return nullptr;
}

TEE_ObjectHandle platform_state::add(object value) {
  return insert<TEE_ObjectHandle>(objects_, std::move(value));
}

TEE_OperationHandle platform_state::add(operation value) {
  return insert<TEE_OperationHandle>(operations_, value);
}

void platform_state::drop(TEE_ObjectHandle handle) {
  if (find(handle) != nullptr) objects_.erase(handle);
}

void platform_state::drop(TEE_OperationHandle handle) {
  if (find(handle) != nullptr) operations_.erase(handle);
}

TEE_TASessionHandle platform_state::open_session() {
  ++sessions_;
  return reinterpret_cast<TEE_TASessionHandle>(&sessions_);
}

void platform_state::close_session(TEE_TASessionHandle handle) {
  if (handle == TEE_HANDLE_NULL) return;
  if (handle != reinterpret_cast<TEE_TASessionHandle>(&sessions_) || sessions_ == 0) {
    violations_.emplace_back("a session's handle that nobody holds");
    return;
  }
  --sessions_;
}

std::string platform_state::label(TEE_ObjectHandle handle) {
  const object* const known = handle == TEE_HANDLE_NULL ? nullptr : find(handle);
  if (known == nullptr) return "null";
  return known->persistent ? "stored" : fmt::format("object {:08x}", known->type);
}

std::string platform_state::label(TEE_OperationHandle handle) {
  const operation* const known = find(handle);
  return known == nullptr ? "none" : fmt::format("operation {:08x}", known->algorithm);
}

}  // namespace second_platform
