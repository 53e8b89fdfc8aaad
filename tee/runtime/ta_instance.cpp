#include "tee/runtime/ta_instance.h"

#include <utility>

namespace hosted_tee {

ta_instance::ta_instance(std::unique_ptr<ta_image> image, std::uint32_t heap_limit, device_services& services,
                         fault_plan& plan)
    : instance(image->parts().head->uuid, heap_limit, services, plan),
      image_(std::move(image)),
      kept_alive_(is_single() && image_->bool_property("gpd.ta.instanceKeepAlive").value_or(false)) {
  trace_prefix = code().trace_prefix;
  properties = code().properties;
}

}  // namespace hosted_tee
