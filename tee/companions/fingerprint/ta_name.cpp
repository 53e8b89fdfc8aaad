// What the TA is called: in the trace, and where the platform describes it.
#include "tee/companions/common/companion_limits.h"
#include "tee_internal_api_extensions.h"

const char tee_trace_prefix[] = "FINGERPRINT";
const char keymaster::companion::ta_description[] = "Turns touches of enrolled fingers into auth tokens";
