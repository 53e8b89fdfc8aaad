#include "client/kmctl/signing.h"

#include "client/kmctl/progress.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

client::operation begin_and_stream(client::session& ta, keymaster::keymaster_purpose_t purpose, const signing_key& key,
                                   const data_stream& data, const char* label) {
  auto op = client::operation::begin(ta, purpose, key.blob, key.parameters, key.app);
  progress_bar bar(label, data.total);
  const auto source = [&](std::span<std::uint8_t> buffer) {
    const std::size_t filled = data.read(buffer);
    bar.advance(filled);
    return filled;
  };
  client::stream(
      op, source, [](byte_view /*signing has no output before its end*/) {}, key.each_step);
  return op;
}

}  // namespace

data_stream data_of(input_file& file) {
  return {.read = [&file](std::span<std::uint8_t> buffer) { return file.read(buffer); }, .total = file.size()};
}

bytes sign_stream(client::session& ta, const signing_key& key, const data_stream& data) {
  return begin_and_stream(ta, keymaster::KM_PURPOSE_SIGN, key, data, "Signing").finish({}, key.each_step).output;
}

void verify_stream(client::session& ta, const signing_key& key, const data_stream& data, byte_view signature) {
  begin_and_stream(ta, keymaster::KM_PURPOSE_VERIFY, key, data, "Verifying").finish(signature, key.each_step);
}

}  // namespace kmctl
