// A TEE Client API in place of the real one: it records what a client sends, and answers what a test prepared.
#ifndef KEYMASTER_TESTS_CLIENT_FAKE_TEE_H_
#define KEYMASTER_TESTS_CLIENT_FAKE_TEE_H_

#include <array>
#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <vector>

#include "client/lib/bytes.h"
#include "tee_client_api.h"

namespace fake_tee {

/// What a slot held when its command arrived: words, the bytes of an input, or the room of an output.
struct slot_held {
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  keymaster::client::bytes data = {};
  std::size_t capacity = 0;
};

/// One command as it arrived.
struct arrival {
  std::uint32_t command;
  std::uint32_t types;
  std::uint32_t a;
  std::uint32_t b;
  keymaster::client::bytes request;
  std::size_t capacity;
  keymaster::client::bytes first = {};  ///< slot 0, where it is memory
  std::array<slot_held, 4> slots = {};
};

/// What to put into one slot, beside or in place of what the answer says on the whole.
struct slot_answer {
  std::size_t slot;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  keymaster::client::bytes body = {};
};

/// One answer to give: the result with its origin, the words of slot 0, and the response body.
struct answer {
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  keymaster::client::bytes body = {};
  TEEC_Result result = TEEC_SUCCESS;
  std::uint32_t origin = TEEC_ORIGIN_TRUSTED_APP;
  std::vector<slot_answer> slots = {};
};

/// What the fake knows. A test starts with reset().
struct state {
  std::deque<answer> answers;  ///< used up front to back; afterwards every command succeeds with nothing
  std::vector<arrival> arrivals;
  TEEC_Result connect_result = TEEC_SUCCESS;
  TEEC_Result open_result = TEEC_SUCCESS;
  std::uint32_t absent_ta = 0;            ///< timeLow of the UUID of a TA that this TEE does not have
  std::vector<std::uint32_t> opened_tas;  ///< timeLow of the UUID of each TA that a session was opened with
  int open_contexts = 0;
  int open_sessions = 0;
  std::string connected_to;
  std::function<void()> at_command;  ///< called with each command, before it is answered
};

state& now();
void reset();

}  // namespace fake_tee

#endif  // KEYMASTER_TESTS_CLIENT_FAKE_TEE_H_
