// A session with any TA, and the slots that a command's parameters go through.
#ifndef KEYMASTER_CLIENT_LIB_TA_SESSION_H_
#define KEYMASTER_CLIENT_LIB_TA_SESSION_H_

#include <array>
#include <cstdint>
#include <span>

#include "client/lib/bytes.h"
#include "client/lib/connection.h"
#include "client/lib/error.h"
#include "tee_client_api.h"

namespace keymaster::client {

/// One of the four slots of a command, with its type: bytes that the TA reads, room for bytes that it writes, or two
/// words. What the slot views must outlive the command.
struct slot {
  std::uint32_t type = TEEC_NONE;
  TEEC_Parameter parameter{};

  [[nodiscard]] static slot bytes_in(byte_view data);
  [[nodiscard]] static slot bytes_out(std::span<std::uint8_t> room);
  [[nodiscard]] static slot value_in(std::uint32_t a, std::uint32_t b = 0);
  [[nodiscard]] static slot value_out();
  [[nodiscard]] static slot value_inout(std::uint32_t a, std::uint32_t b = 0);
  /// number_in puts a 64-bit number into the two words, the low half into `a`; number reads one.
  [[nodiscard]] static slot number_in(std::uint64_t number);
  [[nodiscard]] std::uint64_t number() const;
  /// The two words, and the bytes that the TA says it wrote.
  [[nodiscard]] const TEEC_Value& value() const { return parameter.value; }
  [[nodiscard]] std::size_t size() const { return parameter.tmpref.size; }
};

/// The slots of a command: those that are not named are not used.
using slots = std::array<slot, 4>;

/// What the TEE answered.
struct outcome {
  TEEC_Result result = TEEC_SUCCESS;
  std::uint32_t origin = TEEC_ORIGIN_API;
};

/// A session with a TA, one call at a time.
class ta_session {
 public:
  /// Opens the session. Throws error with error_kind::connection and `step`; TEEC_ERROR_ITEM_NOT_FOUND says that the
  /// TEE does not have this TA.
  ta_session(connection& tee, const TEEC_UUID& ta, const char* step);
  ta_session(const ta_session&) = delete;
  ta_session& operator=(const ta_session&) = delete;
  ~ta_session() { TEEC_CloseSession(&session_); }

  /// invoke carries out a command and leaves in `parameters` what came back. Throws nothing of its own.
  outcome invoke(std::uint32_t command, slots& parameters);

  /// call does the same for a companion's command. Throws error with error_kind::companion and `step` when the result
  /// is not TEEC_SUCCESS, and format_error when the TA says that it wrote more than there was room for.
  void call(const char* step, std::uint32_t command, slots& parameters);

 private:
  TEEC_Session session_{};
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_TA_SESSION_H_
