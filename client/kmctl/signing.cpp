#include "client/kmctl/signing.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

client::operation begin_and_feed(client::session& ta, keymaster::keymaster_purpose_t purpose, const key_use& key,
                                 const data_stream& data, const char* label) {
  auto op = client::operation::begin(ta, purpose, key.blob, key.parameters, key.app);
  feed(op, key, data, label, [](byte_view /*signing has no output before its end*/) {});
  return op;
}

}  // namespace

bytes sign_stream(client::session& ta, const key_use& key, const data_stream& data) {
  return begin_and_feed(ta, keymaster::KM_PURPOSE_SIGN, key, data, "Signing").finish({}, key.each_step).output;
}

void verify_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view signature) {
  begin_and_feed(ta, keymaster::KM_PURPOSE_VERIFY, key, data, "Verifying").finish(signature, key.each_step);
}

}  // namespace kmctl
