// A device in a certain situation, and what can be played on it.
#ifndef TESTS_FAULTS_STAGE_H_
#define TESTS_FAULTS_STAGE_H_

#include <functional>
#include <ostream>
#include <string>

#include "src/params/keymaster_defs.h"
#include "tests/support/device_fixture.h"
#include "tests/support/played_quil.h"
#include "tests/support/rsa_test_key.h"

namespace testing_support {

/// Where a scenario plays, and what its parts hand to each other.
struct stage {
  explicit stage(bool rpmb) : tee(rpmb) {}

  played_quil quil;  // answers nothing unless provision() is called
  device tee;
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  bytes blob;         // the key that the command is about
  param_list params;  // of the operation
  bytes message = from_text("played again and again");
  bytes signature;                     // of the message
  std::uint32_t handle = 0;            // of the operation that the command is about
  std::vector<std::uint32_t> fillers;  // operations that only take up room

  ta_client& client() { return tee.client(); }

  /// provision puts a provisioning TA there that has everything. notify sends a message as the device's fingerprint TA.
  void provision();
  answer notify(const bytes& fid_message);

  /// import makes `blob` from the fixed key; without `list` a key for every kind of signature.
  void import(const param_list& list);
  void import() { import(rsa_key(1024)); }

  /// begin opens the operation that `handle` names.
  void begin(std::uint32_t purpose);

  /// token issues an auth token of the user that bound_key() is bound to.
  [[nodiscard]] bytes token(std::uint64_t challenge);
  [[nodiscard]] param_list with_token() { return param_list{}.add_blob(keymaster::KM_TAG_AUTH_TOKEN, token(handle)); }
};

/// A key of the user 77, for whom a token is needed with each operation.
param_list bound_key();

using act = std::function<void(stage&)>;

/// One command in one situation. A command that fails without a fault is a scenario too: it may then fail otherwise,
/// but it must still fail.
struct scenario {
  std::string name;
  act arrange;                        // once: keys, clocks
  act approach;                       // before each run: the operation that the command needs; may be empty
  std::function<answer(stage&)> run;  // the command
  std::function<void(stage&, const answer&)> settle = {};  // looks at a success and ends what it began; may be empty
  TEEC_Result result = TEEC_SUCCESS;                       // without a fault
  std::int32_t error = 0;
  bool zeroes_response = false;  // on failure, over the whole capacity
  bool rpmb = true;
  bool begins = false;                // the operation is the one that the command itself begins
  bool may_outlive_platform = false;  // the command doesn't ask how one of its platform calls ended, or tries again
  bool may_outlive_memory = false;    // it tries again
  bool keeps_size = false;            // on failure, of the response
};

/// How a scenario shows in a test's output.
inline void PrintTo(const scenario& play, std::ostream* out) {
  *out << play.name;
}

// The scenarios by the commands they play.
std::vector<scenario> key_scenarios();
std::vector<scenario> begin_scenarios();
std::vector<scenario> step_scenarios();
std::vector<scenario> finish_scenarios();
std::vector<scenario> algorithm_scenarios();
std::vector<scenario> soter_scenarios();

}  // namespace testing_support

#endif  // TESTS_FAULTS_STAGE_H_
