#include "tests/commands/raw_session.h"

#include "tests/support/device_fixture.h"

namespace testing_support {

TEE_Param memref(bytes& buffer) {
  TEE_Param param = {};
  param.memref.buffer = buffer.data();
  param.memref.size = static_cast<std::uint32_t>(buffer.size());
  return param;
}

TEE_Param null_memref(std::uint32_t size) {
  TEE_Param param = {};
  param.memref.buffer = nullptr;
  param.memref.size = size;
  return param;
}

TEE_Param values(std::uint32_t a, std::uint32_t b) {
  TEE_Param param = {};
  param.value.a = a;
  param.value.b = b;
  return param;
}

raw_session::raw_session(hosted_tee::secure_world& world) : world_(world) {
  TEE_Identity client = {};
  client.login = TEE_LOGIN_PUBLIC;
  TEE_Param none[4] = {};
  std::uint32_t origin = 0;
  if (world_.open_session(keymaster_ta, client, 0, none, session_, origin) != TEE_SUCCESS) {
    throw std::runtime_error("the TA takes no session");
  }
}

raw_session::~raw_session() {
  world_.close_session(session_);
}

TEE_Result raw_session::invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
  std::uint32_t origin = 0;
  return world_.invoke(session_, command, types, params, origin);
}

raw_answer raw_session::call(std::uint32_t command, std::uint32_t a, TEE_Param request, TEE_Param response) {
  TEE_Param params[4] = {values(a, 0), request, response, {}};
  raw_answer reply;
  reply.result = invoke(command, with_both, params);
  reply.error = static_cast<std::int32_t>(params[0].value.a);
  reply.b = params[0].value.b;
  reply.size = params[2].memref.size;
  return reply;
}

}  // namespace testing_support
