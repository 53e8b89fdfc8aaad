// What the two kinds of statements make alike.
#ifndef KEYMASTER_SOTER_STATEMENT_MEMBERS_H_
#define KEYMASTER_SOTER_STATEMENT_MEMBERS_H_

#include "soter/json_writer.h"
#include "tee_internal_api.h"

namespace keymaster {

/// statement_object answers the object of a new statement. Null, with a trace line: there was no memory for the root.
[[nodiscard]] json_object* statement_object(const json_root& root);

/// add_counter advances the counter and tells it in `object`. TEE_ERROR_BAD_STATE when it can't be set, otherwise the
/// result of increase_and_get_counter.
[[nodiscard]] TEE_Result add_counter(json_object* object);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_STATEMENT_MEMBERS_H_
