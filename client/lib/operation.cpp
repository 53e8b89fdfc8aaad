#include "client/lib/operation.h"

#include <algorithm>
#include <stdexcept>

#include "client/lib/names.h"
#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

/// The most that begin answers is a nonce: a count, a record and 16 bytes. The room beyond costs nothing.
constexpr std::size_t begin_capacity = 256;

/// An update may put out what earlier ones held back: a block, or a tag that turns out to be text.
constexpr std::size_t update_headroom = 32;

/// Two lengths and the count of an empty list stand around the output of finish.
constexpr std::size_t finish_overhead = 12;

}  // namespace

operation operation::begin(session& ta, keymaster_purpose_t purpose, byte_view blob, const authorizations& parameters,
                           const application& app) {
  authorizations all = parameters;
  all.add(app.tags());
  bytes request;
  append_block(request, blob);
  append_block(request, all.marshal());
  return {ta, ta.call({.command = KM_COMMAND_BEGIN,
                       .a = static_cast<std::uint32_t>(purpose),
                       .request = request,
                       .response_capacity = begin_capacity})};
}

operation::operation(session& ta, const reply& answer) : ta_(&ta), handle_(answer.b) {
  try {
    parameters_ = authorizations::unmarshal(answer.body);
  } catch (...) {
    drop();
    throw;
  }
}

operation& operation::operator=(operation&& other) noexcept {
  if (this != &other) {
    drop();
    ta_ = std::exchange(other.ta_, nullptr);
    handle_ = other.handle_;
    parameters_ = std::move(other.parameters_);
  }
  return *this;
}

reply operation::invoke(keymaster_command_t command, byte_view input, const authorizations& parameters,
                        std::size_t capacity) {
  if (ta_ == nullptr) {
    throw std::logic_error("the operation has ended");
  }
  bytes request;
  const bytes marshalled = parameters.marshal();
  request.reserve(8 + input.size() + marshalled.size());
  append_block(request, input);
  append_block(request, marshalled);
  try {
    return ta_->call({.command = command, .a = handle_, .request = request, .response_capacity = capacity});
  } catch (const error& failed) {
    if (failed.facts().tee_origin == TEEC_ORIGIN_TRUSTED_APP) {
      ta_ = nullptr;  // a failure that the TA itself reports has ended the operation there
    }
    throw;
  }
}

operation::step operation::update_once(byte_view input, const authorizations& parameters) {
  reply answer = invoke(KM_COMMAND_UPDATE, input, parameters, input.size() + update_headroom);
  return {.output = std::move(answer.body), .consumed = std::min<std::size_t>(answer.b, input.size())};
}

bytes operation::update(byte_view input, const authorizations& parameters) {
  bytes output;
  while (!input.empty()) {
    const step done = update_once(input.first(std::min(input.size(), chunk_size)), parameters);
    if (done.consumed == 0) {
      drop();
      throw error({.kind = error_kind::keymaster,
                   .step = command_name(KM_COMMAND_UPDATE),
                   .tee_origin = TEEC_ORIGIN_TRUSTED_APP,
                   .keymaster_error = KM_ERROR_INVALID_INPUT_LENGTH});
    }
    append_bytes(output, done.output);
    input = input.subspan(done.consumed);
  }
  return output;
}

void operation::add_associated_data(byte_view data, const authorizations& parameters) {
  while (!data.empty()) {
    const byte_view piece = data.first(std::min(data.size(), chunk_size));
    authorizations all = parameters;
    all.associated_data(piece);
    update_once({}, all);
    data = data.subspan(piece.size());
  }
}

operation::result operation::finish(byte_view signature, const authorizations& parameters, std::size_t output_limit) {
  const reply answer = invoke(KM_COMMAND_FINISH, signature, parameters, finish_overhead + output_limit);
  ta_ = nullptr;
  byte_reader in{answer.body};
  const byte_view output = in.read_block();
  return {.output = {output.begin(), output.end()}, .parameters = authorizations::unmarshal(in.read_block())};
}

void operation::abort() {
  if (session* const ta = std::exchange(ta_, nullptr); ta != nullptr) {
    ta->call({.command = KM_COMMAND_ABORT, .a = handle_});
  }
}

void operation::drop() noexcept {
  try {
    abort();
  } catch (const std::exception&) {
    // Nobody is left who could act on it: the operation is gone already, or the TA is.
    ta_ = nullptr;
  }
}

void stream(operation& op, const byte_source& source, const byte_sink& sink, const authorizations& parameters) {
  bytes buffer(chunk_size);
  while (const std::size_t filled = source(buffer)) {
    sink(op.update(byte_view(buffer).first(filled), parameters));
  }
}

}  // namespace keymaster::client
