// What the way over a socket costs: the same work by a server and by the secure world in this process, in turns.
#include <benchmark/benchmark.h>

#include <stdexcept>

#include "bench/shared_stream.h"
#include "bench/side_by_side.h"
#include "bench/ta_operation.h"
#include "bench/teed_process.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::size_t message_size = 1024;
// Long enough that the updates are what counts, and not begin, finish and how the server awakes when it is its turn.
constexpr std::size_t stream_size = 16U << 20U, stream_step = 65536;
// Signatures of one way behind each other, as a client makes them: else the server would sleep before each.
constexpr int signatures = 5;
constexpr double empty_commands_a_second = 40'000;

constexpr contest socket_contest(double target, int rounds = 1) {
  return {.target = target, .rounds = rounds, .first = "server_us", .second = "embedded_us"};
}

void refused_command(bench_device& device) {
  constexpr std::uint32_t unknown = 0xFEFE;
  if (device.invoke(unknown, 0, nullptr, nullptr).result != TEEC_ERROR_BAD_PARAMETERS) {
    throw std::runtime_error("an unknown command was not refused");
  }
}

/// The least that a command can be: the TA looks at its number and refuses it.
void server_empty_command(benchmark::State& state) {
  const teed_process teed;
  bench_device server(teed.context_name()), embedded;
  run_side_by_side(
      state, socket_contest(0, 10), [&] { refused_command(server); }, [&] { refused_command(embedded); });
  state.counters["a_second"] = 1e6 / static_cast<double>(state.counters["server_us"]);
  state.counters["target"] = empty_commands_a_second;
}
BENCHMARK(server_empty_command)->UseManualTime()->Unit(benchmark::kMicrosecond);

void server_rsa_2048_sign(benchmark::State& state) {
  const teed_process teed;
  bench_device server(teed.context_name()), embedded;
  const bytes message(message_size, 0x6B);
  ta_operation there(server, {KM_PURPOSE_SIGN, server.generate(rsa_sign_key(2048)), rsa_sign_params(), message});
  ta_operation here(embedded, {KM_PURPOSE_SIGN, embedded.generate(rsa_sign_key(2048)), rsa_sign_params(), message});
  run_side_by_side(
      state, socket_contest(0.93, signatures), [&] { benchmark::DoNotOptimize(there.run().data()); },
      [&] { benchmark::DoNotOptimize(here.run().data()); });
}
BENCHMARK(server_rsa_2048_sign)->UseManualTime()->Unit(benchmark::kMicrosecond);

void server_gcm_in_shared_64_kib_updates(benchmark::State& state) {
  const teed_process teed;
  bench_device server(teed.context_name()), embedded;
  shared_stream there(server, stream_size, stream_step), here(embedded, stream_size, stream_step);
  run_side_by_side(
      state, socket_contest(0.80), [&] { there.run(); }, [&] { here.run(); });
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(stream_size));
}
BENCHMARK(server_gcm_in_shared_64_kib_updates)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
