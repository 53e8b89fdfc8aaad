#include "client/kmctl/signing.h"

#include <fmt/format.h>

#include <algorithm>

#include "client/kmctl/exit_codes.h"
#include "client/lib/utf8.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

key_operation begin_and_feed(client::session& ta, keymaster::keymaster_purpose_t purpose, const key_use& key,
                             const data_stream& data, const char* label) {
  key_operation running = begin_use(ta, purpose, key);
  feed(running, data, label, [](byte_view /*signing has no output before its end*/) {});
  return running;
}

/// What a statement has beside its message: names, numbers, the device's properties and a signature.
constexpr std::size_t statement_overhead = 4096;

void check_message(byte_view message) {
  const auto nul = std::ranges::find(message, std::uint8_t{0});
  const auto at = nul == message.end() ? client::invalid_utf8_at(message)
                                       : std::optional(static_cast<std::size_t>(nul - message.begin()));
  if (at) {
    throw failure_error(
        fmt::format("the message is not a text: byte {} is {}", *at, message[*at] == 0 ? "a NUL" : "not UTF-8"),
        "a statement holds its message as a text: sign the hexadecimal or base64 form of this one");
  }
}

}  // namespace

bytes sign_stream(client::session& ta, const key_use& key, const data_stream& data) {
  key_operation running = begin_and_feed(ta, keymaster::KM_PURPOSE_SIGN, key, data, "Signing");
  return running.op.finish({}, running.each_step).output;
}

bytes sign_statement(client::session& ta, const key_use& key, byte_view message) {
  check_message(message);
  key_operation running = begin_use(ta, keymaster::KM_PURPOSE_SIGN, key);
  running.op.update(message, running.each_step);
  // Each character of the message may be written as two.
  return running.op.finish({}, running.each_step, 2 * message.size() + statement_overhead).output;
}

void verify_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view signature) {
  key_operation running = begin_and_feed(ta, keymaster::KM_PURPOSE_VERIFY, key, data, "Verifying");
  running.op.finish(signature, running.each_step);
}

}  // namespace kmctl
