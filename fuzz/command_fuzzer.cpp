// Sequences of commands by a hostile client, with allocations and platform calls that fail on the way. Whatever it
// does: the TA does not panic, touches nothing but its own memory and the buffers it is given, and once the operations
// are aborted it holds what it held before.
#include <array>
#include <initializer_list>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "fuzz/fuzz_steps.h"
#include "fuzz/request_maker.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace fuzzing {
namespace {

constexpr std::size_t most_steps = 40;

struct fixture {
  fuzz_device device;
  std::vector<bytes> blobs;
};

param_writer key_of(std::uint32_t algorithm, std::uint32_t bits, std::initializer_list<std::uint32_t> purposes) {
  param_writer params;
  params.add(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_KEY_SIZE, bits);
  for (const std::uint32_t purpose : purposes) params.add(KM_TAG_PURPOSE, purpose);
  return params;
}

param_writer& add_digests(param_writer& params) {
  for (std::uint32_t digest = KM_DIGEST_NONE; digest <= KM_DIGEST_SHA_2_512; ++digest) {
    params.add(KM_TAG_DIGEST, digest);
  }
  return params;
}

param_writer signing_key() {
  param_writer params = key_of(KM_ALGORITHM_RSA, 512, {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY});
  params.add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
  for (std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN}) {
    params.add(KM_TAG_PADDING, padding);
  }
  return add_digests(params);
}

/// Keys of the other kinds: what begins with them is allowed to do whatever they can do at all.
std::vector<bytes> other_keys() {
  param_writer rsa = key_of(KM_ALGORITHM_RSA, 768, {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT});
  rsa.add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
  for (std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT}) {
    rsa.add(KM_TAG_PADDING, padding);
  }
  param_writer aes = key_of(KM_ALGORITHM_AES, 128, {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT});
  for (std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) aes.add(KM_TAG_BLOCK_MODE, mode);
  aes.add(KM_TAG_PADDING, KM_PAD_NONE).add(KM_TAG_PADDING, KM_PAD_PKCS7);
  aes.add(KM_TAG_CALLER_NONCE, 1).add(KM_TAG_MIN_MAC_LENGTH, 96);
  param_writer ec = key_of(KM_ALGORITHM_EC, 256, {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY});
  add_digests(ec);
  param_writer hmac = key_of(KM_ALGORITHM_HMAC, 256, {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY});
  hmac.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MIN_MAC_LENGTH, 64);
  std::vector<bytes> requests;
  for (param_writer* const key : {&rsa, &aes, &ec, &hmac}) {
    requests.push_back(key->add(KM_TAG_NO_AUTH_REQUIRED, 1).marshal());
  }
  return requests;
}

/// Keys that between them reach every rule of use.
std::vector<bytes> make_blobs(fuzz_device& device) {
  std::vector<bytes> requests = {
      signing_key().add(KM_TAG_NO_AUTH_REQUIRED, 1).marshal(),
      signing_key()
          .add(KM_TAG_NO_AUTH_REQUIRED, 1)
          .add_blob(KM_TAG_APPLICATION_ID, {1, 2, 3})
          .add_blob(KM_TAG_APPLICATION_DATA, {4, 5})
          .marshal(),
      signing_key().add(KM_TAG_NO_AUTH_REQUIRED, 1).add(KM_TAG_MAX_USES_PER_BOOT, 2).marshal(),
      signing_key().add(KM_TAG_USER_SECURE_ID, 1).add(KM_TAG_USER_AUTH_TYPE, 3).marshal(),
      signing_key()
          .add(KM_TAG_USER_SECURE_ID, 1)
          .add(KM_TAG_USER_AUTH_TYPE, 1)
          .add(KM_TAG_AUTH_TIMEOUT, 60)
          .add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 5)
          .marshal(),
      signing_key()
          .add(KM_TAG_NO_AUTH_REQUIRED, 1)
          .add(KM_TAG_SOTER_KEY, 1)
          .add(KM_TAG_ACTIVE_DATETIME, 1'600'000'000'000)
          .add(KM_TAG_USAGE_EXPIRE_DATETIME, 1'800'000'000'000)
          .marshal(),
  };
  for (bytes& other : other_keys()) requests.push_back(std::move(other));
  std::vector<bytes> blobs;
  device.open();
  for (const bytes& request : requests) {
    const reply made = device.run({KM_COMMAND_GENERATE_KEY, 0, 0, request, 8192, std::nullopt});
    require(made.ok(), "the fuzzer's keys are made");
    blobs.push_back(made.response);
  }
  device.close();
  return blobs;
}

fixture& shared_fixture() {
  static fixture* const made = [] {
    auto* const built = new fixture;  // lives as long as the process
    built->blobs = make_blobs(built->device);
    return built;
  }();
  return *made;
}

/// One input's way through the TA.
class command_sequence {
 public:
  command_sequence(fixture& on, input_reader in) : on_(on), in_(in) {}

  void run() {
    for (std::size_t i = 0; i < most_steps && !in_.empty(); ++i) one_step();
    on_.device.world().faults().clear();
    for (const std::uint32_t handle : handles_) abort(handle);
  }

 private:
  void one_step();
  void capability_query();
  void generate();
  void import_key();
  void use_key(std::uint32_t id, bool with_response);
  void begin();
  void feed(std::uint32_t id);
  void raw_command();
  void service_command();
  void order_fault();

  reply send(command what) { return on_.device.run(what); }
  void abort(std::uint32_t handle) { (void)send({KM_COMMAND_ABORT, handle, 0, {}, {}, {}}); }
  void keep_blob(const bytes& blob) {
    if (!blob.empty() && extra_blobs_.size() < 4) extra_blobs_.push_back(blob);
  }
  bytes read_blob();
  std::uint32_t read_handle();
  std::uint32_t read_capacity();

  fixture& on_;
  input_reader in_;
  std::vector<std::uint32_t> handles_;
  std::vector<bytes> extra_blobs_;
};

bytes command_sequence::read_blob() {
  const std::size_t which = in_.below(16);
  const std::size_t known = on_.blobs.size();
  if (which < known) return on_.blobs[which];
  if (which - known < extra_blobs_.size()) return extra_blobs_[which - known];
  bytes blob = on_.blobs.front();
  damage(in_, blob);
  return blob;
}

std::uint32_t command_sequence::read_handle() {
  const std::size_t which = in_.below(8);
  // 0 is the latest, which is the one most likely still there.
  if (!handles_.empty() && which < 7) return handles_[handles_.size() - 1 - which % handles_.size()];
  return in_.u32();
}

std::uint32_t command_sequence::read_capacity() {
  constexpr std::array<std::uint32_t, 8> capacities = {8192, 4096, 512, 80, 64, 16, 4, 0};
  return in_.below(4) < 3 ? 8192 : in_.pick(capacities);
}

void command_sequence::capability_query() {
  constexpr std::array<std::uint32_t, 8> algorithms = {1, 3, 32, 128, 0, 2, 0xFFFFFFFF, 129};
  command what{KM_COMMAND_GET_SUPPORT_ALGO_CNT + static_cast<std::uint32_t>(in_.below(12)), 0, 0, {}, {}, {}};
  if (in_.below(8) != 0) {
    what.a = in_.pick(algorithms);
    what.b = static_cast<std::uint32_t>(in_.below(6));
  }
  if (what.id % 2 == 0) what.capacity = static_cast<std::uint32_t>(in_.below(64));
  (void)send(what);
}

void command_sequence::generate() {
  bytes request = signing_key().marshal();
  if (in_.below(2) == 0) request = read_params(in_, 0);
  damage(in_, request);
  limit_key_size(request);
  const reply made = send({KM_COMMAND_GENERATE_KEY, 0, 0, request, read_capacity(), {}});
  if (made.ok()) keep_blob(made.response);
}

void command_sequence::import_key() {
  constexpr std::array<std::uint32_t, 4> algorithms = {KM_ALGORITHM_RSA, KM_ALGORITHM_EC, KM_ALGORITHM_AES,
                                                       KM_ALGORITHM_HMAC};
  const std::uint32_t algorithm = in_.pick(algorithms);
  bytes params = param_writer{}
                     .add(KM_TAG_ALGORITHM, algorithm)
                     .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
                     .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
                     .add(KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_SIGN)
                     .add(KM_TAG_PADDING, KM_PAD_NONE)
                     .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
                     .add(KM_TAG_MIN_MAC_LENGTH, 96)
                     .add(KM_TAG_NO_AUTH_REQUIRED, 1)
                     .marshal();
  if (in_.below(4) == 0) params = read_params(in_, 0);
  bytes request;
  append_block(request, params);
  const bytes material = read_material(in_, algorithm);
  request.insert(request.end(), material.begin(), material.end());
  damage(in_, request);
  const reply made = send({KM_COMMAND_IMPORT_KEY, 0, 0, request, read_capacity(), {}});
  if (!made.ok()) return;
  const std::uint32_t size = u32_at(made.response, 0);
  require(made.response.size() >= 4 && size <= made.response.size() - 4, "the imported blob lies in the response");
  keep_blob({made.response.begin() + 4, made.response.begin() + 4 + size});
}

void command_sequence::use_key(std::uint32_t id, bool with_response) {
  bytes request;
  append_block(request, read_blob());
  append_block(request, in_.below(2) == 0 ? bytes{1, 2, 3} : in_.take(in_.below(8)));
  append_block(request, in_.below(2) == 0 ? bytes{4, 5} : in_.take(in_.below(8)));
  damage(in_, request);
  command what{id, 0, 0, request, {}, {}};
  if (with_response) what.capacity = read_capacity();
  (void)send(what);
}

void command_sequence::begin() {
  bytes request;
  const std::uint32_t purpose =
      in_.below(8) == 7 ? in_.u32() : (KM_PURPOSE_SIGN + static_cast<std::uint32_t>(in_.below(4))) % 4;
  append_block(request, read_blob());
  append_block(request, read_params(in_, handles_.empty() ? 0 : handles_.back()));
  damage(in_, request);
  const reply begun = send({KM_COMMAND_BEGIN, purpose, 0, request, read_capacity(), {}});
  if (begun.ok()) {
    require(begun.b != 0, "an operation has a handle");
    handles_.push_back(begun.b);
  }
}

void command_sequence::feed(std::uint32_t id) {
  const std::uint32_t handle = read_handle();
  bytes request;
  append_block(request, in_.below(4) == 0 ? bytes(in_.number(2) % 8192, 0x42) : in_.take(in_.below(160)));
  append_block(request, in_.below(2) == 0 ? param_writer{}.marshal() : read_params(in_, handle));
  damage(in_, request);
  (void)send({id, handle, 0, request, read_capacity(), {}});
}

void command_sequence::raw_command() {
  constexpr std::array<std::uint32_t, 8> others = {0, 24, 0xFF00, 0xFF01, 0xFF02, 0xFF03, 0xFF04, 0xFFFFFFFF};
  command what;
  what.id = in_.below(2) == 0 ? in_.pick(others) : static_cast<std::uint32_t>(in_.below(25));
  what.a = in_.below(2) == 0 ? 0 : in_.u32();
  what.b = in_.below(2) == 0 ? 0 : in_.u32();
  what.request = in_.take(in_.below(64));
  if (what.id == KM_COMMAND_GENERATE_KEY) limit_key_size(*what.request);
  what.capacity = static_cast<std::uint32_t>(in_.below(128));
  constexpr std::array<std::uint32_t, 8> kinds = {TEE_PARAM_TYPE_NONE,         TEE_PARAM_TYPE_VALUE_INPUT,
                                                  TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_VALUE_INOUT,
                                                  TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_INOUT,
                                                  TEE_PARAM_TYPE_NONE,         TEE_PARAM_TYPE_MEMREF_OUTPUT};
  what.types =
      TEE_PARAM_TYPES(in_.pick(kinds), in_.pick(kinds), in_.pick(kinds), in_.below(4) == 0 ? in_.pick(kinds) : 0);
  (void)send(what);
}

/// The commands without a key: with the parameter types that they want.
void command_sequence::service_command() {
  constexpr std::uint32_t value_inout = TEE_PARAM_TYPE_VALUE_INOUT, value_output = TEE_PARAM_TYPE_VALUE_OUTPUT,
                          input = TEE_PARAM_TYPE_MEMREF_INPUT, output = TEE_PARAM_TYPE_MEMREF_OUTPUT;
  struct service {
    std::uint32_t id;
    std::uint32_t types;
  };
  constexpr std::array<service, 6> services = {{
      {KM_COMMAND_DELETE_ALL_KEY, TEE_PARAM_TYPES(value_inout, 0, 0, 0)},
      {KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR, TEE_PARAM_TYPES(value_inout, 0, 0, 0)},
      {KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR, TEE_PARAM_TYPES(value_inout, 0, 0, 0)},
      {KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY, TEE_PARAM_TYPES(value_output, 0, output, 0)},
      {KM_COMMAND_SOTER_GET_DEVICE_ID, TEE_PARAM_TYPES(value_output, 0, output, 0)},
      {KM_COMMAND_SOTER_SET_FID, TEE_PARAM_TYPES(0, input, 0, 0)},
  }};
  const service& chosen = in_.pick(services);
  command what{chosen.id, 0, 0, {}, {}, chosen.types};
  what.request = in_.take(in_.below(32));
  what.capacity = static_cast<std::uint32_t>(in_.below(256));
  (void)send(what);
}

void command_sequence::order_fault() {
  constexpr std::array<TEE_Result, 4> results = {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_GENERIC, TEE_ERROR_SHORT_BUFFER,
                                                 TEE_ERROR_BAD_PARAMETERS};
  hosted_tee::fault_plan& faults = on_.device.world().faults();
  const auto after = static_cast<std::uint32_t>(1 + in_.below(48));
  switch (in_.below(3)) {
    case 0:
      faults.fail_allocation(after);
      break;
    case 1:
      faults.fail_any_call(after, in_.pick(results));
      break;
    default:
      on_.device.world().clock().advance(in_.number(3));
  }
}

void command_sequence::one_step() {
  switch (static_cast<step>(in_.below(step_count))) {
    case step::capability_query:
      return capability_query();
    case step::generate:
      return generate();
    case step::import_key:
      return import_key();
    case step::characteristics_size:
      return use_key(KM_COMMAND_GET_KEY_CHARACTER_SIZE, false);
    case step::characteristics:
      return use_key(KM_COMMAND_GET_KEY_CHARACTER, true);
    case step::export_key:
      return use_key(KM_COMMAND_EXPORT_KEY, true);
    case step::delete_key:
      return use_key(KM_COMMAND_DELETE_KEY, false);
    case step::begin:
    case step::begin_again:
      return begin();
    case step::update:
    case step::update_again:
      return feed(KM_COMMAND_UPDATE);
    case step::finish:
      return feed(KM_COMMAND_FINISH);
    case step::abort:
      return abort(read_handle());
    case step::raw_command:
      return raw_command();
    case step::service_command:
      return service_command();
    case step::order_fault:
      return order_fault();
  }
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  fixture& on = shared_fixture();
  on.device.open();
  const hosted_tee::accounting idle = on.device.holdings();
  command_sequence(on, input_reader({data, size})).run();
  require(on.device.holdings().same_holdings(idle), "without operations the TA holds what it held at the start");
  on.device.close();
  return 0;
}
