#include "algorithms/ec/ec_descriptor.h"

namespace keymaster {

// The algorithm has its place in the registry and no entries yet: every command answers as for an algorithm that serves
// no purpose and no format.
constinit const keymaster_algorithm_descriptor ec_descriptor = {
    .algorithm = KM_ALGORITHM_EC,
    .name = "EC",
    .get_purpose_ops = nullptr,
    .get_support_import_format_cnt = nullptr,
    .get_support_import_format = nullptr,
    .get_support_export_format_cnt = nullptr,
    .get_support_export_format = nullptr,
    .generate_key = nullptr,
    .import_key = nullptr,
    .export_key = nullptr,
};

}  // namespace keymaster
