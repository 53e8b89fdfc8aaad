#include "tee/crypto/pair_operation.h"

namespace hosted_tee {

evp_key_context pair_operation::context() const {
  return owned<evp_key_context>(EVP_PKEY_CTX_new_from_pkey(nullptr, key_.get(), nullptr));
}

}  // namespace hosted_tee
