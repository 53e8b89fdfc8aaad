// The debug dump of a parameter set. Lengths of blobs are printed, their bytes never.
#ifndef KEYMASTER_PARAMS_DUMP_H_
#define KEYMASTER_PARAMS_DUMP_H_

#include "params/key_param.h"

namespace keymaster {

/// _keymaster_dump_key_param_set traces the set at debug level: a heading with the caller's place, then two lines a
/// parameter.
void _keymaster_dump_key_param_set(const char* file, int line, const keymaster_key_param_set_t& set);

}  // namespace keymaster

/// KEYMASTER_DUMP_KEY_PARAM_SET dumps with the place it stands at.
#define KEYMASTER_DUMP_KEY_PARAM_SET(set) ::keymaster::_keymaster_dump_key_param_set(__FILE__, __LINE__, set)

#endif  // KEYMASTER_PARAMS_DUMP_H_
