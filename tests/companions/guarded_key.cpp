#include "tests/companions/guarded_key.h"

#include <stdexcept>

using namespace keymaster;

namespace testing_support {
namespace {

param_list scheme() {
  return signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
}

param_list with(const bytes& token, param_list params = {}) {
  return params.add_blob(KM_TAG_AUTH_TOKEN, token);
}

}  // namespace

guarded_key::guarded_key(ta_client& client, std::uint64_t secure_id, std::uint32_t auth_type,
                         std::optional<std::uint32_t> timeout)
    : client_(client) {
  param_list params = rsa_key(1024).remove(KM_TAG_NO_AUTH_REQUIRED);
  params.add(KM_TAG_USER_SECURE_ID, secure_id).add(KM_TAG_USER_AUTH_TYPE, auth_type);
  if (timeout) params.add(KM_TAG_AUTH_TIMEOUT, *timeout);
  blob_ = client_.must_import(params, key_.material());
}

std::int32_t guarded_key::use(const std::function<bytes(std::uint32_t handle)>& token_for) {
  const bytes message = from_text("by a user who was there");
  const answer begun = client_.begin(KM_PURPOSE_SIGN, blob_, scheme());
  if (!begun.ok()) return begun.error;
  const param_list token = with(token_for(begun.b));
  if (const answer fed = client_.update(begun.b, message, token); !fed.ok()) return fed.error;
  const finish_answer done = client_.finish(begun.b, {}, token);
  if (!done.ok()) return done.error;
  if (!key_.verifies(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message, done.data)) {
    throw std::runtime_error("the signature does not verify");
  }
  return KM_ERROR_OK;
}

std::int32_t guarded_key::begin(const std::optional<bytes>& token) {
  const answer begun = client_.begin(KM_PURPOSE_SIGN, blob_, token ? with(*token, scheme()) : scheme());
  if (begun.ok()) client_.abort(begun.b);
  return begun.error;
}

}  // namespace testing_support
