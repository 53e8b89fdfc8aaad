// A client that makes keys, uses old ones and has statements made, through all lives of its server.
#ifndef TESTS_KILLS_KILL_CLIENT_H_
#define TESTS_KILLS_KILL_CLIENT_H_

#include <functional>
#include <memory>
#include <optional>
#include <thread>

#include "client/lib/session.h"
#include "tests/kills/key_safe.h"
#include "tests/kills/kill_stage.h"
#include "tests/kills/statement_ledger.h"

namespace hosted_tee::testing {

/// What the clients of one device share, and what must hold of it over all its lives.
struct kill_field {
  kill_field(const server_place& where, unsigned clients) : place(where), stage(clients) {}

  server_place place;
  kill_stage stage;
  key_safe keys;
  statement_ledger counter;
  /// A soter key that counts and that the attestation key signs for; empty on a device that makes no statements.
  keymaster::client::key_blob statement_key;
};

/// A context with its session.
struct tee_line {
  explicit tee_line(const std::string& name) : tee(name) {}

  keymaster::client::connection tee;
  std::optional<keymaster::client::session> ta;
};

/// expect_gone asserts that every call on a line to a server that is gone says so: TEEC_ERROR_COMMUNICATION, from
/// TEEC_ORIGIN_COMMS.
void expect_gone(tee_line& line);

/// make_statement has one made, by a signature or by an export, and enters its counter.
void make_statement(kill_field& field, keymaster::client::session& ta, bool by_export);

class kill_client {
 public:
  kill_client(kill_field& field, std::uint32_t seed) : field_(field), random_(seed), thread_([this] { run(); }) {}

 private:
  void run();
  void live();
  [[nodiscard]] std::unique_ptr<tee_line> connect();
  void work(tee_line& line);
  void take_step(keymaster::client::session& ta);
  void use_an_old_key(keymaster::client::session& ta);
  void make_a_key(keymaster::client::session& ta);

  kill_field& field_;
  dice random_;
  std::unique_ptr<tee_line> earlier_;  // of the life before
  std::jthread thread_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_CLIENT_H_
