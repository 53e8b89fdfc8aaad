#include "tests/kills/kill_client.h"

#include <gtest/gtest.h>
#include <openssl/evp.h>

#include <fmt/format.h>

#include "client/lib/operation.h"
#include "tests/support/rsa_test_key.h"

namespace hosted_tee::testing {
namespace {

using namespace keymaster;
using client::error;
using client::session;
using testing_support::rsa_test_key;

// The connection has no origin: TEEC_InitializeContext does not tell one.
bool says_that_the_server_is_gone(const error& failure) {
  const auto& facts = failure.facts();
  return facts.tee_result == TEEC_ERROR_COMMUNICATION &&
         (facts.step == "connect" || facts.tee_origin == TEEC_ORIGIN_COMMS) &&
         (failure.kind() == client::error_kind::connection || failure.kind() == client::error_kind::tee);
}

template <class Call>
void expect_call_gone(Call&& call) {
  try {
    call();
    ADD_FAILURE() << "a call to a server that is gone succeeds";
  } catch (const error& failure) {
    EXPECT_TRUE(says_that_the_server_is_gone(failure)) << failure.what();
  }
}

std::string pem_of(const rsa_test_key& key) {
  const auto der = key.spki();
  std::string base64((der.size() + 2) / 3 * 4 + 1, '\0');
  const int length =
      EVP_EncodeBlock(reinterpret_cast<unsigned char*>(base64.data()), der.data(), static_cast<int>(der.size()));
  base64.resize(static_cast<std::size_t>(length));
  return "-----BEGIN PUBLIC KEY-----\n" + base64 + "\n-----END PUBLIC KEY-----";
}

client::bytes signed_statement(session& ta, const kill_field& field, const std::string& challenge) {
  const auto parameters = client::authorizations{}.digest({KM_DIGEST_SHA_2_256}).padding({KM_PAD_RSA_PKCS1_1_5_SIGN});
  auto op = client::operation::begin(ta, KM_PURPOSE_SIGN, field.statement_key, parameters);
  op.update(client::as_bytes(challenge));
  return op.finish().output;
}

}  // namespace

void expect_gone(tee_line& line) {
  if (line.ta) {
    expect_call_gone([&] { (void)make_key(*line.ta, key_kind::aes); });
  }
  expect_call_gone([&] { const session another(line.tee); });
}

void make_statement(kill_field& field, session& ta, bool by_export) {
  const statement_ledger::request asked = field.counter.ask();
  std::optional<std::uint64_t> value;
  if (by_export) {
    static const std::string public_key = pem_of(rsa_test_key::of_bits(1024));
    value = counter_in(client::export_key(ta, field.statement_key), 2048, "pub_key", public_key);
  } else {
    const std::string challenge = fmt::format("after {}", asked.highest_before);
    value = counter_in(signed_statement(ta, field, challenge), 1024, "raw", challenge);
  }
  if (value) field.counter.note(asked, *value);
}

void kill_client::run() {
  unsigned life = 0;
  while ((life = field_.stage.next_life(life)) != 0) {
    try {
      live();
    } catch (const std::exception& failure) {
      ADD_FAILURE() << failure.what();
    }
    field_.stage.leave();
  }
}

void kill_client::live() {
  std::unique_ptr<tee_line> line = connect();
  if (line == nullptr) return;
  if (earlier_ != nullptr) expect_gone(*earlier_);
  try {
    work(*line);
  } catch (const error& failure) {
    EXPECT_TRUE(says_that_the_server_is_gone(failure)) << failure.what();
    EXPECT_TRUE(field_.stage.is_doomed()) << "a server that nobody kills is gone: " << failure.what();
    field_.stage.note_cut(failure.facts().step);
  }
  expect_gone(*line);
  earlier_ = std::move(line);
}

// Until the server serves, and as long as it may come.
std::unique_ptr<tee_line> kill_client::connect() {
  while (!field_.stage.is_over()) {
    try {
      return std::make_unique<tee_line>(field_.place.context_name());
    } catch (const error& failure) {
      EXPECT_TRUE(says_that_the_server_is_gone(failure)) << failure.what();
    }
    std::this_thread::sleep_for(std::chrono::microseconds(500));
  }
  return nullptr;
}

// Ends with the server only.
void kill_client::work(tee_line& line) {
  for (;;) {
    field_.stage.begin(client_step::open);
    line.ta.reset();
    line.ta.emplace(line.tee);
    use_an_old_key(*line.ta);
    for (std::size_t steps = pick(random_, 30); steps > 0; --steps) {
      field_.stage.rest_if_asked();
      take_step(*line.ta);
    }
  }
}

void kill_client::take_step(session& ta) {
  field_.stage.begin(client_step::work);
  const std::size_t chance = pick(random_, 100);
  if (chance < 45) {
    make_a_key(ta);
  } else if (chance < 55 || field_.statement_key.empty()) {
    use_an_old_key(ta);
  } else {
    field_.stage.begin(client_step::statement);
    make_statement(field_, ta, chance < 75);
  }
}

void kill_client::use_an_old_key(session& ta) {
  if (field_.keys.size() == 0) return;
  field_.stage.begin(client_step::use);
  field_.keys.use(ta, pick(random_, field_.keys.size()));
}

void kill_client::make_a_key(session& ta) {
  const std::size_t chance = pick(random_, 100);
  const key_kind kind = chance < 4 ? key_kind::rsa : static_cast<key_kind>(chance % 3);
  field_.stage.begin(client_step::generate);
  const std::size_t place = field_.keys.put(kind, make_key(ta, kind));
  field_.keys.use(ta, place);
}

}  // namespace hosted_tee::testing
