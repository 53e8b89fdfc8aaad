#include "bench/bench_device.h"

#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <utility>

#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr TEEC_UUID teec_uuid = KEYMASTER_TA_UUID;
constexpr TEE_UUID tee_uuid = KEYMASTER_TA_UUID;

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(what);
}

}  // namespace

temporary_folder::temporary_folder() {
  std::string name = (std::filesystem::temp_directory_path() / "keymaster-bench-XXXXXX").string();
  must(mkdtemp(name.data()) != nullptr, "no temporary folder");
  path_ = name;
}

temporary_folder::~temporary_folder() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

bench_device::bench_device() : own_folder_(std::in_place) {
  start(own_folder_->path() / "state");
}

bench_device::bench_device(std::filesystem::path state) {
  start(state);
}

bench_device::bench_device(std::string context_name) : context_name_(std::move(context_name)) {
  open();
}

void bench_device::start(const std::filesystem::path& state) {
  hosted_tee::world_options options;
  options.state = state;
  options.kept_trace = hosted_tee::trace_level::error;  // as for every client
  world_ = hosted_tee::secure_world::open_shared(options);
  context_name_ = "embedded:" + state.string();
  open();
}

bench_device::~bench_device() {
  close();
  world_.reset();
}

void bench_device::open() {
  must(TEEC_InitializeContext(context_name_.c_str(), &context_) == TEEC_SUCCESS, "no connection to the TEE");
  must(TEEC_OpenSession(&context_, &session_, &teec_uuid, TEEC_LOGIN_PUBLIC, nullptr, nullptr, nullptr) == TEEC_SUCCESS,
       "no session to the TA");
}

void bench_device::close() {
  TEEC_CloseSession(&session_);
  TEEC_FinalizeContext(&context_);
}

void bench_device::reopen() {
  close();
  open();
}

hosted_tee::accounting bench_device::accounting() const {
  return world_->account(tee_uuid);
}

reply bench_device::invoke(std::uint32_t command, std::uint32_t a, const bytes* request, bytes* response) {
  TEEC_Operation operation = {};
  operation.paramTypes = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, request != nullptr ? TEEC_MEMREF_TEMP_INPUT : TEEC_NONE,
                                          response != nullptr ? TEEC_MEMREF_TEMP_OUTPUT : TEEC_NONE, TEEC_NONE);
  operation.params[0].value = {a, 0};
  // The Client API has no const form; an input is only read.
  if (request != nullptr) operation.params[1].tmpref = {const_cast<std::uint8_t*>(request->data()), request->size()};
  if (response != nullptr) operation.params[2].tmpref = {response->data(), response->size()};
  reply answer;
  answer.result = TEEC_InvokeCommand(&session_, command, &operation, nullptr);
  answer.a = operation.params[0].value.a;
  answer.b = operation.params[0].value.b;
  if (response != nullptr) answer.size = operation.params[2].tmpref.size;
  return answer;
}

reply bench_device::must_invoke(std::uint32_t command, std::uint32_t a, const bytes* request, bytes* response) {
  const reply answer = invoke(command, a, request, response);
  must(answer.result == TEEC_SUCCESS && answer.a == KM_ERROR_OK, "a command failed");
  return answer;
}

bytes bench_device::generate(const bytes& params) {
  bytes blob(16384);
  blob.resize(must_invoke(KM_COMMAND_GENERATE_KEY, 0, &params, &blob).size);
  return blob;
}

bytes bench_device::import_key(const bytes& params, const bytes& material) {
  bytes request, response(16384);
  append_block(request, params);
  request.insert(request.end(), material.begin(), material.end());
  must_invoke(KM_COMMAND_IMPORT_KEY, 0, &request, &response);
  return {response.begin() + 4, response.begin() + 4 + u32_at(response, 0)};
}

}  // namespace bench
