// The four commands that open a key blob for its application, as a table: what holds of one holds of all.
#ifndef TESTS_COMMANDS_KEYS_KEY_COMMANDS_H_
#define TESTS_COMMANDS_KEYS_KEY_COMMANDS_H_

#include <functional>

#include "tests/commands/command_fixture.h"

namespace testing_support {

struct key_command {
  const char* name;
  std::function<answer(ta_client&, const bytes& blob, const bytes& app_id, const bytes& app_data)> call;
};

inline const std::vector<key_command>& key_commands() {
  using namespace keymaster;
  static const std::vector<key_command> all = {
      {"get_key_character_size", [](ta_client& client, const bytes& blob, const bytes& id,
                                    const bytes& data) { return client.characteristics_size(blob, id, data); }},
      {"get_key_character", [](ta_client& client, const bytes& blob, const bytes& id,
                               const bytes& data) { return client.characteristics(blob, id, data); }},
      {"export_key", [](ta_client& client, const bytes& blob, const bytes& id,
                        const bytes& data) { return client.export_key(blob, id, data); }},
      {"begin",
       [](ta_client& client, const bytes& blob, const bytes& id, const bytes& data) {
         param_list params = signature(KM_DIGEST_NONE, KM_PAD_NONE);
         if (!id.empty()) params.add_blob(KM_TAG_APPLICATION_ID, id);
         if (!data.empty()) params.add_blob(KM_TAG_APPLICATION_DATA, data);
         const answer begun = client.begin(KM_PURPOSE_SIGN, blob, params);
         if (begun.ok()) (void)client.abort(begun.b);
         return begun;
       }},
  };
  return all;
}

}  // namespace testing_support

#endif  // TESTS_COMMANDS_KEYS_KEY_COMMANDS_H_
