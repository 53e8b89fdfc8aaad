// The soter framework between a hostile client and a provisioning TA that answers anything: boxes, lengths, results.
// The TA does not panic and keeps nothing; what it signs is what it was asked to sign, under the right key, and no
// counter value is told twice.
#include <array>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "fuzz/request_maker.h"
#include "fuzz/soter_device.h"
#include "fuzz/soter_steps.h"
#include "soter/soter_init.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"
#include "tests/support/played_quil.h"

using namespace keymaster;
using testing_support::fingerprint_ta;
using testing_support::played_quil;

namespace fuzzing {
namespace {

constexpr std::size_t most_steps = 24;
constexpr std::uint32_t no_uid = 0xFFFFFFFF;
constexpr TEE_UUID keymaster_ta = KEYMASTER_TA_UUID;
constexpr std::string_view counter_object{"SOTER_COUNTER_OBJECT", 21};
constexpr std::uint64_t finger_validity = 3000;

/// A signing operation that the client has begun.
struct operation {
  std::uint32_t handle = 0;
  const soter_blob* key = nullptr;
  std::uint32_t digest = 0, padding = 0;
  bytes message;
};

/// One input's way through the TA.
class soter_sequence {
 public:
  soter_sequence(soter_device& on, input_reader in) : on_(on), in_(in) {}

  void run();

 private:
  void one_step();
  void service();
  void notify();
  void change_key();
  void change_property();
  void export_key();
  void begin();
  void update();
  void finish();
  void order_fault();
  void restart();
  void store_counter();

  reply send(const command& what);
  void forget_operation();
  void note_load(bool was_loaded);
  void read_answer(played_quil::response& response, const bytes& good);
  void expect_counter(const bytes& text, const std::string& expected);
  [[nodiscard]] std::string finger() const;
  [[nodiscard]] std::uint64_t now() const;

  soter_device& on_;
  input_reader in_;
  operation op_;
  hosted_tee::accounting idle_ = {};
  // What was loaded, where it is known: the fixture's own key and properties.
  bool true_key_ = false, true_properties_ = false;
  std::uint64_t counter_ = 0;
  std::uint32_t fid_ = 0;
  std::uint64_t fid_time_ = 0;
};

bool same(const played_quil::response& answer, const bytes& data) {
  return answer.result == TEE_SUCCESS && !answer.length && answer.data == data;
}

/// Sees to it that a load is known for what it is.
void soter_sequence::note_load(bool was_loaded) {
  if (was_loaded || !soter_ready()) return;
  const bytes whole = testing_support::attestation_key_box(on_.attestation.components()),
              part = testing_support::attestation_key_box(on_.attestation.components(), 3);
  true_key_ = same(on_.quil->key, whole) || same(on_.quil->key, part);
  true_properties_ =
      same(on_.quil->properties[testing_support::soter_property], testing_support::soter_property_box()) &&
      same(on_.quil->properties[testing_support::cpu_id_property], bytes_of(soter_device::cpu_id));
}

reply soter_sequence::send(const command& what) {
  const bool was_loaded = soter_ready();
  const reply answer = on_.device.run(what);
  require(on_.quil->open_sessions == 0 && on_.quil->complaints.empty(), "the provisioning TA is called as agreed");
  note_load(was_loaded);
  return answer;
}

void soter_sequence::service() {
  constexpr std::uint32_t value_inout = TEE_PARAM_TYPE_VALUE_INOUT, value_output = TEE_PARAM_TYPE_VALUE_OUTPUT,
                          output = TEE_PARAM_TYPE_MEMREF_OUTPUT;
  const auto which = static_cast<std::uint32_t>(in_.below(4));
  const bool responds = which >= 2;
  command what{KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR + which, 0, 0, {}, {}, {}};
  what.types = responds ? TEE_PARAM_TYPES(value_output, 0, output, 0) : TEE_PARAM_TYPES(value_inout, 0, 0, 0);
  if (responds) what.capacity = static_cast<std::uint32_t>(in_.number(2) % 700);
  const reply answer = send(what);
  require(answer.result == TEE_SUCCESS, "the framework's commands tell by their status");
  const auto status = static_cast<std::int32_t>(answer.a);
  if (status == 0 && what.id == KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY && true_key_) {
    const std::string pem = on_.attestation.pem();
    require(escaped(answer.response) == pem + '\0', "the attestation key is exported as it is");
  }
  if (status == 0 && what.id == KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR) require(soter_ready(), "a load is one");
}

void soter_sequence::notify() {
  constexpr std::array<std::uint64_t, 6> ages = {0, 1, 2999, 3000, 3001, static_cast<std::uint64_t>(-1)};
  TEE_Identity client = {TEE_LOGIN_TRUSTED_APP, fingerprint_ta};
  const std::size_t who = in_.below(8);
  if (who == 6) client.login = TEE_LOGIN_PUBLIC;
  if (who == 7) client.uuid.clockSeqAndNode[in_.below(8)] ^= 1;
  bytes message;
  const std::uint32_t version = in_.below(8) == 7 ? in_.u32() : 0, fid = in_.u32();
  const std::uint64_t time = now() - in_.pick(ages);
  append_u32(message, version);
  append_u32(message, fid);
  append_u64(message, time);
  if (in_.below(8) == 7) message.resize(in_.below(32));
  const bool well_formed = message.size() == 16 && u32_at(message, 0) == 0;
  hosted_tee::fault_plan& faults = on_.device.world().faults();
  const reply answer = on_.device.run_as(
      client, {KM_COMMAND_SOTER_SET_FID, 0, 0, message, {}, TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0)});
  const bool taken = answer.result == TEE_SUCCESS;
  if (!soter_ready() || true_properties_) {
    const bool known = who < 6 && soter_ready();
    require(!taken || (known && well_formed), "a finger is told by the fingerprint TA, in its message");
    require(taken || !known || !well_formed || faults.triggered(), "the fingerprint TA tells a finger");
  }
  require(!taken || well_formed, "a finger is told in a message of the one form");
  if (!taken) return;
  fid_ = u32_at(message, 4);
  fid_time_ = u32_at(message, 8) | std::uint64_t{u32_at(message, 12)} << 32;
}

/// Half of the answers are good ones; the others are damaged, cut, refused, or lie about their length.
void soter_sequence::read_answer(played_quil::response& response, const bytes& good) {
  constexpr std::array<TEE_Result, 6> results = {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_ITEM_NOT_FOUND, TEE_ERROR_GENERIC,
                                                 TEE_ERROR_SHORT_BUFFER,  TEE_ERROR_COMMUNICATION,  0xF0001234};
  constexpr std::array<std::uint32_t, 8> lengths = {0, 1, 3, 64, 65, 512, 8193, 0xFFFFFFFF};
  response = {};
  response.data = good;
  switch (in_.below(8)) {
    case 4:
      for (std::size_t faults = 1 + in_.below(3); faults > 0 && !response.data.empty(); --faults) {
        response.data[in_.number(2) % response.data.size()] ^= static_cast<std::uint8_t>(1 + in_.below(255));
      }
      break;
    case 5:
      response.data = in_.take(in_.number(2) % 1200);
      break;
    case 6:
      response.result = in_.pick(results);
      break;
    case 7:
      response.length = in_.below(2) == 0 ? in_.pick(lengths) : in_.u32();
      break;
    default:
      break;
  }
}

void soter_sequence::change_key() {
  const std::size_t components = in_.below(4) == 3 ? in_.below(9) : in_.below(2) == 0 ? 8 : 3;
  read_answer(on_.quil->key, testing_support::attestation_key_box(on_.attestation.components(), components));
}

void soter_sequence::change_property() {
  switch (in_.below(3)) {
    case 0:
      return read_answer(on_.quil->properties[testing_support::soter_property], testing_support::soter_property_box());
    case 1:
      return read_answer(on_.quil->properties[testing_support::cpu_id_property], bytes_of(soter_device::cpu_id));
    default:
      return read_answer(on_.quil->properties[testing_support::device_id_property], bytes(32, 7));
  }
}

void soter_sequence::expect_counter(const bytes& text, const std::string& expected) {
  const std::optional<std::uint64_t> counter = counter_in(text, expected);
  require(counter.has_value(), "a statement says what it should");
  require(*counter > counter_, "no counter is told twice, and none goes back");
  counter_ = *counter;
}

void soter_sequence::export_key() {
  const soter_blob& key = on_.blobs.at(in_.below(soter_key_count));
  const auto capacity = static_cast<std::uint32_t>(in_.below(4) == 3 ? in_.number(2) % 1024 : 4096);
  bytes request;
  append_block(request, key.blob);
  append_block(request, {});
  append_block(request, {});
  const reply answer = send({KM_COMMAND_EXPORT_KEY, 0, 0, request, capacity, {}});
  if (!answer.ok()) return;
  require(key.signed_by_attk || key.signed_by_key, "somebody signs a statement");
  const statement made = take_apart(answer.response);
  std::string expected = "{";
  if (key.counted) expected += std::string("\"counter\":") + counter_place + ',';
  if (key.has_uid) expected += "\"uid\":" + std::to_string(soter_device::uid) + ',';
  expected += "\"pub_key\":\"" + on_.key.pem() + "\"}";
  if (key.counted) {
    expect_counter(made.text, expected);
  } else {
    require(made.text == bytes_of(expected), "a statement says what it should");
  }
  if (key.signed_by_key) require(on_.key.signed_by(made.text, made.signature), "the key's signer has signed");
  if (key.signed_by_attk && true_key_) {
    require(on_.attestation.signed_by(made.text, made.signature), "the attestation key has signed");
  }
}

void soter_sequence::forget_operation() {
  if (op_.handle != 0) (void)send({KM_COMMAND_ABORT, op_.handle, 0, {}, {}, {}});
  op_ = {};
}

void soter_sequence::begin() {
  constexpr std::array<std::uint32_t, 4> paddings = {KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_PSS, KM_PAD_NONE,
                                                     KM_PAD_RSA_PKCS1_1_5_SIGN};
  forget_operation();
  const soter_blob& key = on_.blobs.at(in_.below(soter_key_count));
  const std::uint32_t padding = in_.pick(paddings);
  const std::uint32_t digest = padding == KM_PAD_NONE || in_.below(8) == 7 ? KM_DIGEST_NONE : KM_DIGEST_SHA_2_256;
  bytes request;
  append_block(request, key.blob);
  append_block(request, param_writer{}.add(KM_TAG_DIGEST, digest).add(KM_TAG_PADDING, padding).marshal());
  const reply answer = send({KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, 0, request, 4096, {}});
  if (answer.ok()) op_ = {answer.b, &key, digest, padding, {}};
}

void soter_sequence::update() {
  constexpr std::array<std::size_t, 6> sizes = {0, 4095, 4096, 4097, 9000, 60'000};
  if (op_.handle == 0) return;
  const bytes input = in_.below(8) == 7 ? bytes(in_.pick(sizes), 'm') : in_.take(in_.below(80));
  bytes request;
  append_block(request, input);
  append_block(request, param_writer{}.marshal());
  const reply answer = send({KM_COMMAND_UPDATE, op_.handle, 0, request, 64, {}});
  if (!answer.ok()) return forget_operation();
  require(answer.b == input.size(), "a message is taken whole");
  op_.message.insert(op_.message.end(), input.begin(), input.end());
}

std::uint64_t soter_sequence::now() const {
  const TEE_Time time = on_.device.world().clock().system();
  return std::uint64_t{time.seconds} * 1000 + time.millis;
}

std::string soter_sequence::finger() const {
  return now() - fid_time_ <= finger_validity ? "\"fid\":" + std::to_string(fid_) + ',' : "";
}

void soter_sequence::finish() {
  if (op_.handle == 0) return;
  const operation op = std::exchange(op_, {});
  bytes request;
  append_block(request, {1, 2, 3});  // not part of the message
  append_block(request, param_writer{}.marshal());
  const reply answer = send({KM_COMMAND_FINISH, op.handle, 0, request, 300'000, {}});
  if (!answer.ok()) return;
  require(op.digest != KM_DIGEST_NONE, "nothing is stated without a digest");
  const std::uint32_t size = u32_at(answer.response, 0);
  require(answer.response.size() >= 4 && size <= answer.response.size() - 4, "a signature lies in the response");
  const statement made = take_apart({answer.response.begin() + 4, answer.response.begin() + 4 + size});
  require(on_.key.signed_by(made.text, made.signature, op.padding == KM_PAD_RSA_PSS), "the key has signed");
  const std::string raw = "{\"raw\":\"" + escaped(op.message) + "\"," + finger() + "\"counter\":" + counter_place;
  const std::string expected_uid = ",\"uid\":" + std::to_string(op.key->has_uid ? soter_device::uid : no_uid) + ',';
  if (true_properties_) return expect_counter(made.text, raw + expected_uid + soter_device::facts + "}" + '\0');
  require(made.text.size() > 2 && made.text.back() == 0, "a sign statement ends with its NUL");
}

void soter_sequence::order_fault() {
  constexpr std::array<TEE_Result, 4> results = {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_GENERIC, TEE_ERROR_SHORT_BUFFER,
                                                 TEE_ERROR_ITEM_NOT_FOUND};
  hosted_tee::fault_plan& faults = on_.device.world().faults();
  const auto after = static_cast<std::uint32_t>(1 + in_.below(96));
  if (in_.below(2) == 0) {
    faults.fail_allocation(after);
  } else {
    faults.fail_any_call(after, in_.pick(results));
  }
}

/// A fresh instance; the device keeps its counter.
void soter_sequence::restart() {
  forget_operation();
  const TEE_Time time = on_.device.world().clock().system();
  on_.device.close();
  on_.device.open();
  on_.device.world().clock().set_system(time);
  require(!soter_ready(), "a fresh instance has loaded nothing");
  true_key_ = true_properties_ = false;
  fid_ = 0;
  fid_time_ = 0;
}

/// Somebody wrote into the storage: what is told from then on is counted from there. Only behind 64 bits, which nobody
/// counts through, would it begin again.
void soter_sequence::store_counter() {
  constexpr std::array<std::size_t, 5> sizes = {8, 8, 4, 12, 0};
  constexpr std::array<std::uint64_t, 6> values = {
      0, 41, 0xFFFFFFFF, 99'999'999'997, (std::uint64_t{1} << 53) - 2, 0x7FFFFFFFFFFFFFFE};
  bytes data;
  append_u64(data, in_.pick(values));
  data.resize(in_.pick(sizes), 0x55);
  on_.device.world().write_object(keymaster_ta, TEE_STORAGE_PRIVATE, counter_object,
                                  std::string(data.begin(), data.end()));
  counter_ = 0;
}

void soter_sequence::one_step() {
  switch (static_cast<soter_step>(in_.below(soter_step_count))) {
    case soter_step::service:
      return service();
    case soter_step::notify:
      return notify();
    case soter_step::change_key:
      return change_key();
    case soter_step::change_property:
      return change_property();
    case soter_step::change_opening:
      on_.quil->opens = in_.below(4) == 3 ? TEE_ERROR_BUSY : TEE_SUCCESS;
      return;
    case soter_step::export_key:
      return export_key();
    case soter_step::begin:
      return begin();
    case soter_step::update:
      return update();
    case soter_step::finish:
      return finish();
    case soter_step::advance_clock:
      return on_.device.world().clock().advance(in_.number(2));
    case soter_step::order_fault:
      return order_fault();
    case soter_step::restart:
      return restart();
    case soter_step::store_counter:
      return store_counter();
  }
}

void soter_sequence::run() {
  on_.provision();
  on_.device.world().delete_object(keymaster_ta, TEE_STORAGE_PRIVATE, counter_object);
  on_.device.open();
  idle_ = on_.device.holdings();
  for (std::size_t i = 0; i < most_steps && !in_.empty(); ++i) one_step();
  on_.device.world().faults().clear();
  forget_operation();
  const hosted_tee::accounting left = on_.device.holdings();
  require(soter_ready() || left.same_holdings(idle_), "what failed to load holds nothing");
  require(left.operations == idle_.operations && left.transient_objects == idle_.transient_objects &&
              left.persistent_objects == idle_.persistent_objects,
          "nothing stays open");
  on_.device.close();
}

soter_device& shared_device() {
  static auto* const made = new soter_device;  // lives as long as the process
  return *made;
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  soter_sequence(shared_device(), input_reader({data, size})).run();
  return 0;
}
