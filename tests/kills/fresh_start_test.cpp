// The first start of a device, killed: what it left is a device that starts, or nothing.
#include "tests/kills/kill_fixture.h"

namespace hosted_tee::testing {
namespace {

constexpr unsigned clients = 2;

using std::chrono::milliseconds;

class FreshStartTest : public KillTest {
 protected:
  /// When to kill: some time below `limit` after the start, or after a client is about to open the first session, which
  /// has the TA make the key that it keeps in the RPMB storage.
  struct moment {
    bool after_the_start;
    milliseconds limit;
  };

  /// A new device that is killed once for each moment, and then asked for all that it ever gave.
  void live(const std::string& name, std::initializer_list<moment> moments) {
    kill_field field(place(name.c_str()), clients);
    {
      const client_crowd crowd(field, clients, random);
      for (const moment& when : moments) {
        field.stage.begin_life();
        teed_process server(field.place);
        if (!when.after_the_start) field.stage.wait_for_steps(client_step::open, 1, server);
        sleep_below(random, when.limit);
        field.stage.doom();
        const process_end end = server.kill();
        EXPECT_EQ(end.signal, SIGKILL) << "it has ended by itself: " << end.said;
        field.stage.end_life();
      }
    }
    expect_whole(field);
    keys += field.keys.size();
  }

  std::size_t keys = 0;
};

TEST_F(FreshStartTest, ADeviceThatIsKilledAtItsVeryFirstStartStartsTheNextTime) {
  const unsigned rounds = std::max(plan.rounds / 5, 1U);
  for (unsigned round = 0; round < rounds && !HasFailure(); ++round) {
    SCOPED_TRACE(::testing::Message() << "in round " << round);
    const std::string number = std::to_string(round);
    live(number + "-once", {{true, milliseconds(30)}});
    live(number + "-again", {{true, milliseconds(10)}, {true, milliseconds(30)}, {true, milliseconds(100)}});
    live(number + "-opened", {{false, milliseconds(20)}});
  }
  std::printf("%u new devices killed, %zu keys\n", 3 * rounds, keys);
}

}  // namespace
}  // namespace hosted_tee::testing
