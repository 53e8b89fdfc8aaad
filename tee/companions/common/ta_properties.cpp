// What the platform reports for a companion. One instance serves all sessions and dies with the last.
#include "tee/companions/common/companion_limits.h"

extern "C" const tee_ta_property ta_properties[] = {
    {"gpd.ta.singleInstance", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.multiSession", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.instanceKeepAlive", TEE_TA_PROPERTY_BOOL, 0, nullptr},
    {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, keymaster::companion::heap_size, nullptr},
    {"gpd.ta.stackSize", TEE_TA_PROPERTY_U32, keymaster::companion::stack_size, nullptr},
    {"gpd.ta.version", TEE_TA_PROPERTY_STRING, 0, "1.0"},
    {"gpd.ta.description", TEE_TA_PROPERTY_STRING, 0, keymaster::companion::ta_description},
    {nullptr, 0, 0, nullptr},
};
