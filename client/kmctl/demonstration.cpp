#include "client/kmctl/demonstration.h"

#include <fmt/format.h>

#include <algorithm>
#include <chrono>
#include <utility>

#include "client/kmctl/console.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"
#include "client/kmctl/progress.h"
#include "client/lib/key_material.h"

namespace kmctl {

namespace client = keymaster::client;

demonstration::demonstration(const context& ctx, std::string file, std::filesystem::path folder, bool force)
    : ctx_(ctx),
      file_(std::move(file)),
      folder_(std::move(folder)),
      existing_(force ? overwrite::always : overwrite::never),
      tee_(ctx) {
  for (const char* const name : demo_files) {
    refuse_overwriting(path(name), {file_});
    check_output(path(name), rules());
  }
}

void demonstration::say(const std::string& text) const {
  if (!ctx_.json_output) {
    print(text + "\n");
  }
}

void demonstration::step(const char* name, const char* title, const std::function<std::string()>& work) {
  const auto start = std::chrono::steady_clock::now();
  const std::string told = work();
  const std::chrono::duration<double, std::milli> took = std::chrono::steady_clock::now() - start;
  steps_.push_back({{"step", name}, {"milliseconds", took.count()}, {"result", told}});
  say(fmt::format("\n{}. {} ({:.{}f} ms)\n{}", steps_.size(), title, took.count(), took.count() < 1 ? 2 : 0, told));
}

bytes demonstration::generate(const char* name, const client::authorizations& description) {
  bytes blob;
  {
    const spinner alive("Generating");
    blob = client::generate_key(ta(), description);
  }
  keep_blob(name, blob);
  return blob;
}

void demonstration::export_public(const char* name, keymaster::keymaster_algorithm_t algorithm, byte_view blob) {
  keep(name, client::as_bytes(client::public_key_pem(algorithm, client::export_key(ta(), blob))));
}

std::string demonstration::by_openssl(const std::vector<std::string>& words, const char* what) {
  const command_result result = run_command(words);
  if (result.status != 0) {
    throw failure_error(fmt::format("openssl did not {}: {}", what, result.output));
  }
  const std::string first = result.output.substr(0, result.output.find('\n'));
  return fmt::format("   $ {}{}{}", shell_words(words), first.empty() ? "" : "\n   ", first);
}

std::string demonstration::refused(const char* what, const std::function<void()>& attempt,
                                   const std::function<bool(const client::failure&)>& as_it_must) {
  try {
    attempt();
  } catch (const client::error& refusal) {
    if (as_it_must(refusal.facts())) {
      return fmt::format("   Refused, as it must be: {}", refusal.what());
    }
    throw;
  }
  throw failure_error(fmt::format("the TA accepted {}", what));
}

tampered_file::tampered_file(const std::string& path, std::uint64_t offset)
    : file_(path), left_(std::min(offset, std::max<std::uint64_t>(file_.size().value_or(0), 1) - 1)) {}

std::size_t tampered_file::read(std::span<std::uint8_t> buffer) {
  const std::size_t filled = file_.read(buffer);
  if (tampered_) {
    return filled;
  }
  if (left_ >= buffer.size()) {
    left_ -= buffer.size();
    return filled;
  }
  tampered_ = true;
  std::uint8_t& byte = buffer[static_cast<std::size_t>(left_)];
  byte = filled == 0 ? 0x21 : byte ^ 1U;
  return std::max<std::size_t>(filled, 1);
}

data_stream tampered_file::data() {
  return {.read = [this](std::span<std::uint8_t> buffer) { return read(buffer); }, .total = file_.size()};
}

bool is_wrong_signature(const client::failure& facts) {
  return facts.keymaster_error == keymaster::KM_ERROR_VERIFICATION_FAILED && facts.tee_result == TEEC_SUCCESS;
}

}  // namespace kmctl
