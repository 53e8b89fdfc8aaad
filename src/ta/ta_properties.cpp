// The properties that the platform reports for the TA. One instance serves all sessions and dies with the last: key
// store, operations and authorization state are shared, and nothing outlives the clients.
#include "ta/ta_limits.h"
#include "tee_ta_image.h"

extern "C" const tee_ta_property ta_properties[] = {
    {"gpd.ta.singleInstance", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.multiSession", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.instanceKeepAlive", TEE_TA_PROPERTY_BOOL, 0, nullptr},
    {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, keymaster::ta_heap_size, nullptr},
    {"gpd.ta.stackSize", TEE_TA_PROPERTY_U32, keymaster::ta_stack_size, nullptr},
    {"gpd.ta.version", TEE_TA_PROPERTY_STRING, 0, "Undefined version"},
    {"gpd.ta.description", TEE_TA_PROPERTY_STRING, 0, "Undefined description"},
    {nullptr, 0, 0, nullptr},
};
