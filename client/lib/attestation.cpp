#include "client/lib/attestation.h"

#include "client/lib/rsa_public_key.h"
#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

/// The PEM of a 2048-bit key has 445 bytes with its zero. This is enough for any size of attestation key.
constexpr std::size_t pem_capacity = 4096;

/// When the room is too small the answer doesn't tell how much it takes, so there is plenty.
constexpr std::size_t device_id_capacity = 64;

attk_status status_of(const error& refused) {
  return refused.facts().soter_status == SOTER_STATUS_NO_ATTK ? attk_status::absent : attk_status::unreadable;
}

}  // namespace

void ensure_ready(session& ta) {
  ta.call_soter({.command = KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR});
}

void verify_attk(session& ta) {
  ta.call_soter({.command = KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR});
}

attk_status get_attk_status(session& ta) {
  try {
    verify_attk(ta);
    return attk_status::present;
  } catch (const error& refused) {
    if (refused.kind() != error_kind::soter) {
      throw;
    }
    return status_of(refused);
  }
}

bool is_ready(session& ta) {
  try {
    ensure_ready(ta);
    return true;
  } catch (const error& refused) {
    if (refused.kind() != error_kind::soter) {
      throw;
    }
    return false;
  }
}

std::string export_attk(session& ta) {
  const bytes answer =
      ta.call_soter({.command = KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, .response_capacity = pem_capacity}).body;
  std::string pem(as_text(answer));
  if (pem.empty() || pem.find('\0') != pem.size() - 1) {
    throw format_error("the attestation key does not end in one zero");
  }
  pem.pop_back();
  (void)rsa_public_key::from_statement(pem);
  return pem;
}

bytes get_device_id(session& ta) {
  bytes id = ta.call_soter({.command = KM_COMMAND_SOTER_GET_DEVICE_ID, .response_capacity = device_id_capacity}).body;
  if (id.empty()) {
    throw format_error("the device's id is empty");
  }
  return id;
}

}  // namespace keymaster::client
