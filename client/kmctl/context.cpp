#include "client/kmctl/context.h"

#include <fmt/format.h>

#include <cstdlib>
#include <filesystem>
#include <system_error>

#include "client/kmctl/console.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/system_failure.h"
#include "client/lib/names.h"
#include "src/params/keymaster_defs.h"
#include "tee/client/default_folder.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;
using keymaster::client::error;
using keymaster::client::error_kind;

fs::path default_state() {
  if (const auto folder = hosted_tee::default_state_folder()) {
    return *folder;
  }
  throw failure_error("there is no home folder to keep the device's state in", "name a folder with --state");
}

std::string embedded(const fs::path& state) {
  return "embedded:" + fs::absolute(state).string();
}

/// JSON is UTF-8 and the names of files and the texts of properties need not be: what isn't becomes U+FFFD.
std::string dump(const json& object) {
  return object.dump(2, ' ', false, json::error_handler_t::replace);
}

std::string hint_of(const std::exception& failed) {
  if (const auto* const of_tee = dynamic_cast<const error*>(&failed)) {
    return of_tee->hint();
  }
  if (const auto* const usage = dynamic_cast<const usage_error*>(&failed)) {
    return usage->hint();
  }
  if (const auto* const failure = dynamic_cast<const failure_error*>(&failed)) {
    return failure->hint();
  }
  if (const auto* const of_system = dynamic_cast<const std::system_error*>(&failed)) {
    return advice_on(of_system->code().value());
  }
  return {};
}

template <class Number>
json named(const std::string& name, Number value) {
  return {{"name", name}, {"value", value}};
}

/// What goes with the result depends on who answered.
void add_refusal(json& object, const keymaster::client::failure& facts) {
  switch (facts.kind) {
    case error_kind::soter:
      object["soter_status"] = named(keymaster::client::soter_status_name(facts.soter_status), facts.soter_status);
      break;
    case error_kind::companion:
      if (facts.wait_ms != 0) {
        object["wait_ms"] = facts.wait_ms;
      }
      break;
    default:
      object["keymaster_error"] =
          named(keymaster::client::keymaster_error_name(facts.keymaster_error), facts.keymaster_error);
  }
}

bool data_takes_stdout(const context& ctx) {
  return ctx.data_on_stdout && ctx.data_on_stdout();
}

}  // namespace

std::string tee_name(const context& ctx) {
  if (!ctx.tee.empty()) {
    return ctx.tee;
  }
  if (!ctx.state.empty()) {
    return embedded(ctx.state);
  }
  if (const char* const name = std::getenv("KEYMASTER_TEE"); name != nullptr && *name != '\0') {
    return name;
  }
  return embedded(default_state());
}

tee_link::tee_link(const context& ctx) : name_(tee_name(ctx)), connection_(name_), session_(connection_) {}

void tell(const context& ctx, const std::string& text, const json& object) {
  const std::string told = ctx.json_output ? dump(object) : text;
  if (told.empty()) {
    return;
  }
  if (data_takes_stdout(ctx)) {
    complain(told + "\n");
  } else {
    print(told + "\n");
  }
}

int exit_code_of(const std::exception& failed) {
  const auto* const of_tee = dynamic_cast<const error*>(&failed);
  if (of_tee == nullptr) {
    return dynamic_cast<const usage_error*>(&failed) != nullptr ? exit_usage : exit_failure;
  }
  switch (of_tee->kind()) {
    case error_kind::connection:
      return exit_no_connection;
    case error_kind::tee:
    case error_kind::companion:
      return exit_tee_error;
    case error_kind::soter:
      return exit_keymaster;
    case error_kind::keymaster:
      break;
  }
  const bool invalid = of_tee->facts().keymaster_error == keymaster::KM_ERROR_VERIFICATION_FAILED;
  return invalid ? exit_invalid : exit_keymaster;
}

json failure_json(const std::exception& failed) {
  json object = {{"message", failed.what()}, {"hint", hint_of(failed)}, {"exit_code", exit_code_of(failed)}};
  if (const auto* const of_tee = dynamic_cast<const error*>(&failed)) {
    const auto& facts = of_tee->facts();
    object["step"] = facts.step;
    object["tee_result"] = named(keymaster::client::tee_result_name(facts.tee_result), facts.tee_result);
    object["tee_origin"] = keymaster::client::tee_origin_name(facts.tee_origin);
    add_refusal(object, facts);
  }
  return object;
}

void tell_failure_json(const context& ctx, const json& object) {
  try {
    tell(ctx, {}, object);
  } catch (const failure_error&) {
    complain(dump(object) + "\n");
  }
}

void tell_failure(const context& ctx, const std::exception& failed) {
  if (ctx.json_output) {
    tell_failure_json(ctx, {{"error", failure_json(failed)}});
    return;
  }
  const std::string hint = hint_of(failed);
  complain(
      fmt::format("kmctl: {}\n{}", failed.what(), hint.empty() ? std::string{} : fmt::format("  hint: {}\n", hint)));
}

}  // namespace kmctl
