#include "bench/ta_operation.h"

#include <algorithm>

#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::size_t finish_room = 4096;

}  // namespace

ta_operation::ta_operation(bench_device& device, const operation_plan& plan)
    : device_(device), purpose_(plan.purpose), response_(std::max(finish_room, plan.message.size())) {
  append_block(begin_request_, plan.blob);
  append_block(begin_request_, plan.params);
  append_block(finish_request_, {});
  append_block(finish_request_, marshal({}));
  const std::size_t step = plan.step == 0 ? plan.message.size() : plan.step;
  for (std::size_t at = 0; at < plan.message.size(); at += step) {
    const auto from = plan.message.begin() + static_cast<std::ptrdiff_t>(at);
    const std::size_t size = std::min(step, plan.message.size() - at);
    bytes& request = update_requests_.emplace_back();
    append_block(request, {from, from + static_cast<std::ptrdiff_t>(size)});
    append_block(request, marshal({}));
  }
}

std::uint32_t ta_operation::begin() {
  return device_.must_invoke(KM_COMMAND_BEGIN, purpose_, &begin_request_, &response_).b;
}

const bytes& ta_operation::run() {
  const std::uint32_t handle = begin();
  for (const bytes& request : update_requests_) device_.must_invoke(KM_COMMAND_UPDATE, handle, &request, &response_);
  device_.must_invoke(KM_COMMAND_FINISH, handle, &finish_request_, &response_);
  output_.assign(response_.begin() + 4, response_.begin() + 4 + u32_at(response_, 0));
  return output_;
}

}  // namespace bench
