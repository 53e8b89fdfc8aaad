// A second platform under the TA, as small as it can be: no cryptography, no storage behind it, every answer scripted
// and every call noted. It shows what a real platform cannot: the order and the arguments of calls, and what becomes of
// answers that no platform should give.
//
// By default calls succeed. Ciphers hand their input through, digests, MACs and signatures are a fixed pattern of the
// right length, and the one tag that verifies is the one that is given out. What the TA hands in is read to its last
// byte, and where it lies in a block of the TA's heap it must lie there whole, on any processor and without sanitizers.
#ifndef TESTS_SECOND_PLATFORM_PLATFORM_H_
#define TESTS_SECOND_PLATFORM_PLATFORM_H_

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tee_internal_api.h"
#include "tee_internal_api_extensions.h"
#include "tests/support/bytes.h"

namespace second_platform {

using testing_support::bytes;

/// How an answer departs from the platform's own.
struct twist {
  std::optional<TEE_Result> result;              // this instead
  bool undone = false;                           // and nothing is done: no output, no handle
  std::optional<std::uint32_t> beyond_capacity;  // the length reported exceeds the room offered by so much
  bool second_length = false;                    // the length meant is the second, that of a tag
};

struct object {
  std::uint32_t type = 0;
  std::uint32_t bits = 0;
  bool persistent = false;
  std::pair<std::uint32_t, bytes> stored;  // storage and identifier of a persistent object
  std::size_t position = 0;
};

struct operation {
  std::uint32_t algorithm = 0;
  std::uint32_t mode = 0;
  std::uint32_t bits = 0;
  std::uint32_t tag_bits = 0;
  std::uint32_t held = 0;  // bytes of an incomplete block
};

struct holdings {
  std::size_t heap_blocks = 0, objects = 0, operations = 0, sessions = 0;
  bool operator==(const holdings&) const = default;
};

class platform_state {
 public:
  /// power_on forgets everything: what was held, stored, noted and scripted.
  void power_on();

  // What the TA did.
  /// The calls since the last clear, without those of the heap and the trace, as "TEE_Name(arguments)".
  [[nodiscard]] const std::vector<std::string>& calls() const { return calls_; }
  /// Their names alone.
  [[nodiscard]] std::vector<std::string> names() const;
  [[nodiscard]] std::uint32_t heap_calls() const { return heap_calls_; }
  /// What the TA's heap holds, and the most that it held since restart_peak. A block costs what it costs on the hosted
  /// TEE: its size in whole words of 8 bytes, and 16 bytes for the heap's own book.
  [[nodiscard]] std::uint32_t heap_bytes() const { return heap_bytes_; }
  [[nodiscard]] std::uint32_t heap_peak() const { return heap_peak_; }
  void restart_peak() { heap_peak_ = heap_bytes_; }
  /// The error lines since the last clear.
  [[nodiscard]] const std::vector<std::string>& errors() const { return errors_; }
  void clear();
  /// Ranges outside their block, writes outside a block, handles that nobody holds: all that must never be.
  [[nodiscard]] const std::vector<std::string>& violations();
  [[nodiscard]] holdings held() const;

  // What the platform answers.
  /// answer makes the `nth` call of a function from now on (1 is the next; 0 all) depart from the rule.
  void answer(std::string_view function, std::uint32_t nth, const twist& departure);
  void no_more_departures() { departures_.clear(), counts_.clear(); }
  bool rpmb = true;
  bytes key_box, property_box, cpu_id, device_id;  // of the provisioning TA
  TEE_Identity client = {};
  std::optional<bytes> public_operation;  // what a bare RSA operation yields next, instead of the pattern
  std::map<std::pair<std::uint32_t, bytes>, bytes> storage;

  // For the platform's functions.
  /// enter notes a call and answers how it is to depart.
  twist enter(const char* function, const std::string& arguments);
  /// deliver hands out `content`, or as little as `departure` says.
  TEE_Result deliver(const twist& departure, const bytes& content, void* place, std::uint32_t* length);
  /// read takes the bytes that the TA hands in.
  bytes read(const void* data, std::uint32_t size);
  void check_range(const void* data, std::uint32_t size, const char* what);
  void* allocate(std::uint32_t size);
  /// grow moves a block to one of another size; on failure the block stays as it is.
  void* grow(void* block, std::uint32_t size);
  void free(void* block);
  void trace(int level, std::string text);
  bytes random(std::uint32_t size);

  /// find answers what a handle stands for; nothing for the null handle, which makes a call with a result fail.
  object* find(TEE_ObjectHandle handle);
  operation* find(TEE_OperationHandle handle);
  TEE_ObjectHandle add(object value);
  TEE_OperationHandle add(operation value);
  void drop(TEE_ObjectHandle handle);
  void drop(TEE_OperationHandle handle);
  TEE_TASessionHandle open_session();
  void close_session(TEE_TASessionHandle handle);
  /// label names a handle in the notes: by what it is, and not by an address.
  std::string label(TEE_ObjectHandle handle);
  std::string label(TEE_OperationHandle handle);

 private:
  struct block {
    std::unique_ptr<std::uint8_t[]> memory;  // with a margin on both sides
    std::uint32_t size = 0;
  };
  void check_margins(const block& checked);

  std::vector<std::string> calls_, errors_, violations_;
  std::uint32_t heap_calls_ = 0, heap_bytes_ = 0, heap_peak_ = 0, randoms_ = 0, sessions_ = 0;
  std::map<std::string, std::uint32_t, std::less<>> counts_;
  std::map<std::pair<std::string, std::uint32_t>, twist, std::less<>> departures_;
  std::map<const std::uint8_t*, block> blocks_;
  std::map<const void*, std::unique_ptr<object>> objects_;
  std::map<const void*, std::unique_ptr<operation>> operations_;
};

extern platform_state platform;

/// shown is how bytes stand in a note: in hexadecimal, or by their number where they are many.
std::string shown(const bytes& data);

/// What the platform gives out: the pattern of the digest, the MAC or the signature of so many bytes.
bytes fixed_output(std::size_t size);

}  // namespace second_platform

#endif  // TESTS_SECOND_PLATFORM_PLATFORM_H_
