#include "bench/bench_device.h"

#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>

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

void append_u64(bytes& body, std::uint64_t value) {
  append_u32(body, static_cast<std::uint32_t>(value));
  append_u32(body, static_cast<std::uint32_t>(value >> 32));
}

}  // namespace

void append_u32(bytes& body, std::uint32_t value) {
  for (int shift = 0; shift < 32; shift += 8) body.push_back(static_cast<std::uint8_t>(value >> shift));
}

void append_block(bytes& body, const bytes& block) {
  append_u32(body, static_cast<std::uint32_t>(block.size()));
  body.insert(body.end(), block.begin(), block.end());
}

std::uint32_t u32_at(const bytes& data, std::size_t offset) {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < 4; ++i) value |= std::uint32_t{data.at(offset + i)} << (8 * i);
  return value;
}

bytes marshal(std::initializer_list<std::pair<std::uint32_t, std::uint64_t>> params) {
  bytes body;
  append_u32(body, static_cast<std::uint32_t>(params.size()));
  for (const auto& [tag, value] : params) {
    append_u32(body, tag);
    append_u32(body, 0);
    append_u64(body, value);
    append_u64(body, 0);
  }
  return body;
}

bytes rsa_sign_key(std::uint32_t bits) {
  return marshal({{KM_TAG_ALGORITHM, KM_ALGORITHM_RSA},
                  {KM_TAG_KEY_SIZE, bits},
                  {KM_TAG_RSA_PUBLIC_EXPONENT, 65537},
                  {KM_TAG_PURPOSE, KM_PURPOSE_SIGN},
                  {KM_TAG_DIGEST, KM_DIGEST_SHA_2_256},
                  {KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_SIGN},
                  {KM_TAG_NO_AUTH_REQUIRED, 1}});
}

bytes rsa_sign_params() {
  return marshal({{KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}, {KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_SIGN}});
}

bench_device::bench_device() {
  std::string name = (std::filesystem::temp_directory_path() / "keymaster-bench-XXXXXX").string();
  must(mkdtemp(name.data()) != nullptr, "no temporary folder");
  folder_ = name;
  hosted_tee::world_options options;
  options.state = folder_ / "state";
  world_ = hosted_tee::secure_world::open_shared(options);
  open();
}

bench_device::~bench_device() {
  close();
  world_.reset();
  std::error_code ignored;
  std::filesystem::remove_all(folder_, ignored);
}

void bench_device::open() {
  const std::string name = "embedded:" + (folder_ / "state").string();
  must(TEEC_InitializeContext(name.c_str(), &context_) == TEEC_SUCCESS, "no connection to the TEE");
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

ta_signer::ta_signer(bench_device& device, const bytes& blob, const bytes& message) : device_(device), response_(4096) {
  append_block(begin_request_, blob);
  append_block(begin_request_, rsa_sign_params());
  append_block(update_request_, message);
  append_block(update_request_, marshal({}));
  append_block(finish_request_, {});
  append_block(finish_request_, marshal({}));
}

std::uint32_t ta_signer::begin() {
  return device_.must_invoke(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, &begin_request_, &response_).b;
}

const bytes& ta_signer::sign() {
  const std::uint32_t handle = begin();
  device_.must_invoke(KM_COMMAND_UPDATE, handle, &update_request_, &response_);
  device_.must_invoke(KM_COMMAND_FINISH, handle, &finish_request_, &response_);
  signature_.assign(response_.begin() + 4, response_.begin() + 4 + u32_at(response_, 0));
  return signature_;
}

}  // namespace bench
