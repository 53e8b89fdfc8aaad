#include "tests/kills/kill_fixture.h"

#include <fmt/format.h>
#include <sqlite3.h>

#include <fstream>
#include <iterator>

#include "client/lib/device_information.h"
#include "client/lib/provisioning.h"
#include "tests/support/rsa_test_key.h"

namespace hosted_tee::testing {
namespace {

using namespace keymaster;
using testing_support::rsa_test_key;

client::bytes content_of(const char* file) {
  std::ifstream stream(file, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), {}};
}

void put_factory_data(tee_line& line) {
  client::provisioning factory(line.tee);
  factory.put_key(client::read_attestation_key(content_of("tests/data/rsa_2048.pem")));
  factory.put_soter_properties("sensor", "v2", client::fingerprint_ta);
  factory.put_cpu_id("CPU-0001");
  factory.put_device_id(client::bytes(client::shortest_device_id, 'd'));
  factory.lock();
}

client::key_blob make_statement_key(tee_line& line) {
  const auto description = client::authorizations{}
                               .algorithm(KM_ALGORITHM_RSA)
                               .purpose({KM_PURPOSE_SIGN})
                               .digest({KM_DIGEST_SHA_2_256})
                               .padding({KM_PAD_RSA_PKCS1_1_5_SIGN})
                               .no_auth_required()
                               .soter_key()
                               .soter_signed_by_attk()
                               .soter_counted();
  return client::import_key(*line.ta, description, rsa_test_key::of_bits(1024).material()).blob;
}

void expect_provisioned(tee_line& line) {
  client::provisioning factory(line.tee);
  const client::provisioning_status expected = {
      .key = true, .data = false, .soter_properties = true, .cpu_id = true, .device_id = true, .locked = true};
  EXPECT_EQ(factory.status(), expected);
}

// SQLite's own judgement of a database that nobody has open.
void expect_in_order(const std::filesystem::path& file) {
  sqlite3* opened = nullptr;
  ASSERT_EQ(sqlite3_open_v2(file.c_str(), &opened, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
  const std::unique_ptr<sqlite3, decltype(&sqlite3_close)> database(opened, sqlite3_close);
  std::string verdict;
  const auto append = [](void* text, int, char** values, char**) {
    *static_cast<std::string*>(text) += values[0];
    return 0;
  };
  EXPECT_EQ(sqlite3_exec(opened, "PRAGMA integrity_check", append, &verdict, nullptr), SQLITE_OK);
  EXPECT_EQ(verdict, "ok") << file;
}

}  // namespace

std::unique_ptr<tee_line> line_to(const kill_field& field, const teed_process& server) {
  const auto limit = std::chrono::steady_clock::now() + ample_time;
  while (!server.has_ended() && std::chrono::steady_clock::now() < limit) {
    try {
      auto line = std::make_unique<tee_line>(field.place.context_name());
      line->ta.emplace(line->tee);
      return line;
    } catch (const client::error& failure) {
      // Before it listens; once a context is there, a session has to be.
      EXPECT_EQ(failure.facts().step, "connect") << failure.what();
      EXPECT_EQ(failure.facts().tee_result, TEEC_ERROR_COMMUNICATION);
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  ADD_FAILURE() << "the server does not serve: " << server.said();
  return nullptr;
}

void provision(kill_field& field) {
  teed_process server(field.place);
  if (const auto line = line_to(field, server)) {
    put_factory_data(*line);
    field.statement_key = make_statement_key(*line);
    make_statement(field, *line->ta, /*by_export=*/true);
  }
  const process_end end = server.terminate();
  ASSERT_EQ(end.code, teed_done) << end.said;
}

void expect_whole(kill_field& field) {
  teed_process server(field.place);
  if (const auto line = line_to(field, server)) {
    EXPECT_TRUE(client::device_information(line->tee).state().has_rpmb);
    for (std::size_t place = 0; place < field.keys.size(); ++place) field.keys.use(*line->ta, place);
    if (!field.statement_key.empty()) {
      expect_provisioned(*line);
      make_statement(field, *line->ta, /*by_export=*/true);
      make_statement(field, *line->ta, /*by_export=*/false);
    }
  }
  const process_end end = server.terminate();
  EXPECT_EQ(end.code, teed_done) << end.said;
  for (const char* suffix : {"", ".lock", ".new"}) {
    EXPECT_FALSE(std::filesystem::exists(field.place.socket.string() + suffix)) << suffix;
  }
  for (const char* name : {"private.db", "rpmb.db"}) expect_in_order(field.place.state / name);
}

KillTest::~KillTest() {
  if (HasFailure()) (void)std::fprintf(stderr, "the same plan again: %s\n", plan.text().c_str());
}

}  // namespace hosted_tee::testing
