#include "bench/shared_stream.h"

#include <algorithm>
#include <stdexcept>

#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::uint32_t tag_bits = 128;
constexpr std::size_t finish_room = 4096;

void allocate(TEEC_Context& context, TEEC_SharedMemory& memory, std::size_t size, std::uint32_t flags) {
  memory = {nullptr, size, flags, {}};
  if (TEEC_AllocateSharedMemory(&context, &memory) != TEEC_SUCCESS) throw std::runtime_error("no shared memory");
}

}  // namespace

shared_stream::shared_stream(bench_device& device, std::size_t total, std::size_t step)
    : device_(device), rounds_(total / step), response_(finish_room) {
  const bytes blob = device.import_key(key_params(KM_ALGORITHM_AES, 256,
                                                  {{KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT},
                                                   {KM_TAG_BLOCK_MODE, KM_MODE_GCM},
                                                   {KM_TAG_PADDING, KM_PAD_NONE},
                                                   {KM_TAG_MIN_MAC_LENGTH, tag_bits}}),
                                       bytes(32, 0x42));
  append_block(begin_request_, blob);
  append_block(
      begin_request_,
      marshal({{KM_TAG_BLOCK_MODE, KM_MODE_GCM}, {KM_TAG_PADDING, KM_PAD_NONE}, {KM_TAG_MAC_LENGTH, tag_bits}}));
  append_block(finish_request_, {});
  append_block(finish_request_, marshal({}));
  bytes request;
  append_block(request, bytes(step, 0x6B));
  append_block(request, marshal({}));
  allocate(device.context(), request_, request.size(), TEEC_MEM_INPUT);
  allocate(device.context(), output_, step + finish_room, TEEC_MEM_OUTPUT);
  std::copy(request.begin(), request.end(), static_cast<std::uint8_t*>(request_.buffer));
}

shared_stream::~shared_stream() {
  TEEC_ReleaseSharedMemory(&request_);
  TEEC_ReleaseSharedMemory(&output_);
}

void shared_stream::update(std::uint32_t handle) {
  TEEC_Operation operation = {};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_WHOLE, TEEC_MEMREF_WHOLE, TEEC_NONE);
  operation.params[0].value = {handle, 0};
  operation.params[1].memref = {&request_, 0, 0};
  operation.params[2].memref = {&output_, 0, 0};
  const TEEC_Result result = TEEC_InvokeCommand(&device_.session(), KM_COMMAND_UPDATE, &operation, nullptr);
  if (result != TEEC_SUCCESS || operation.params[0].value.a != KM_ERROR_OK) throw std::runtime_error("update failed");
}

void shared_stream::run() {
  const std::uint32_t handle = device_.must_invoke(KM_COMMAND_BEGIN, KM_PURPOSE_ENCRYPT, &begin_request_, &response_).b;
  for (std::size_t i = 0; i < rounds_; ++i) update(handle);
  device_.must_invoke(KM_COMMAND_FINISH, handle, &finish_request_, &response_);
}

}  // namespace bench
