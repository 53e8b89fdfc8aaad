#include "client/kmctl/context.h"

#include <fmt/format.h>
#include <pwd.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <optional>

#include "client/kmctl/exit_codes.h"
#include "client/lib/names.h"
#include "src/params/keymaster_defs.h"

namespace kmctl {
namespace {

namespace fs = std::filesystem;
using keymaster::client::error;
using keymaster::client::error_kind;

std::optional<std::string> environment(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr || *value == '\0' ? std::nullopt : std::optional<std::string>(value);
}

fs::path default_state() {
  if (const auto base = environment("XDG_STATE_HOME"); base && fs::path(*base).is_absolute()) {
    return fs::path(*base) / "keymaster";
  }
  if (const auto home = environment("HOME")) {
    return fs::path(*home) / ".local" / "state" / "keymaster";
  }
  const passwd* const user = ::getpwuid(::getuid());
  if (user == nullptr || user->pw_dir == nullptr) {
    throw failure_error("there is no home folder to keep the device's state in", "name a folder with --state");
  }
  return fs::path(user->pw_dir) / ".local" / "state" / "keymaster";
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
  return {};
}

}  // namespace

std::string tee_name(const context& ctx) {
  if (!ctx.tee.empty()) {
    return ctx.tee;
  }
  if (!ctx.state.empty()) {
    return embedded(ctx.state);
  }
  if (const auto name = environment("KEYMASTER_TEE")) {
    return *name;
  }
  if (const auto folder = environment("KEYMASTER_STATE")) {
    return embedded(*folder);
  }
  return embedded(default_state());
}

tee_link::tee_link(const context& ctx) : name_(tee_name(ctx)), connection_(name_), session_(connection_) {}

void tell(const context& ctx, const std::string& text, const json& object, const std::string& data_path) {
  std::FILE* const out = data_path == "-" ? stderr : stdout;
  if (ctx.json_output) {
    fmt::print(out, "{}\n", dump(object));
  } else if (!text.empty()) {
    fmt::print(out, "{}\n", text);
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
      return exit_tee_error;
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
    object["tee_result"] = {{"name", keymaster::client::tee_result_name(facts.tee_result)},
                            {"value", facts.tee_result}};
    object["tee_origin"] = keymaster::client::tee_origin_name(facts.tee_origin);
    object["keymaster_error"] = {{"name", keymaster::client::keymaster_error_name(facts.keymaster_error)},
                                 {"value", facts.keymaster_error}};
  }
  return object;
}

int tell_failure(const context& ctx, const std::exception& failed) {
  if (ctx.json_output) {
    fmt::print(stdout, "{}\n", dump({{"error", failure_json(failed)}}));
  } else {
    fmt::print(stderr, "kmctl: {}\n", failed.what());
    if (const std::string hint = hint_of(failed); !hint.empty()) {
      fmt::print(stderr, "  hint: {}\n", hint);
    }
  }
  return exit_code_of(failed);
}

}  // namespace kmctl
