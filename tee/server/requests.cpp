// What a connection does for each kind of request.
#include <unistd.h>

#include <algorithm>

#include "tee/runtime/client_identity.h"
#include "tee/runtime/uuid.h"
#include "tee/server/connection.h"
#include "tee/socket/packet_socket.h"

namespace hosted_tee {
namespace {

using remote::outcome;

constexpr outcome done{TEEC_SUCCESS, TEEC_ORIGIN_TEE};

// What the server refuses before its TEE is asked.
constexpr outcome refused(TEEC_Result why) {
  return {why, TEEC_ORIGIN_COMMS};
}

}  // namespace

// The server ends with the command that runs, and begins none of those that wait behind it.
template <class Command>
void connection::take_turn(remote::outcome& told, const Command& carry_out) {
  const std::scoped_lock turn(core_.turn);
  if (core_.stopping) {
    told = refused(TEEC_ERROR_COMMUNICATION);
  } else {
    carry_out();
  }
}

bool connection::owns(std::uint32_t session) const {
  return std::find(sessions_.begin(), sessions_.end(), session) != sessions_.end();
}

bool connection::hello(const remote::frame& request, int /*file*/) {
  remote::empty_request nothing;
  if (!remote::read_body(request.body, nothing)) return false;
  has_greeted_ = true;
  limit_receiving(channel_.socket(), std::chrono::seconds(0));
  answer(request, remote::hello_answer{done, static_cast<std::uint32_t>(remote::frame_limit), core_.limits.sessions,
                                       core_.limits.blocks, core_.limits.memory});
  return true;
}

TEE_Identity connection::identity_for(const remote::open_request& request, outcome& found) const {
  const auto method = find_login_method(request.login);
  if (!method || (!method->group && request.group != 0)) {
    found = refused(TEEC_ERROR_BAD_PARAMETERS);
    return {};
  }
  const std::optional<std::string> program = method->application ? client_.program() : std::string();
  if (!program || (method->group && !client_.is_member_of(request.group))) {
    found = refused(TEEC_ERROR_ACCESS_DENIED);
    return {};
  }
  return identity_of(*method, {client_.user(), request.group, *program});
}

bool connection::open_session(const remote::frame& request, int /*file*/) {
  remote::open_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  remote::open_answer told{done, 0, {asked.params.types, {}}};
  const TEE_Identity client = identity_for(asked, told.done);
  if (told.done.result == TEEC_SUCCESS && sessions_.size() >= core_.limits.sessions) {
    told.done = refused(TEEC_ERROR_BUSY);
  }
  call_memory memory(scratch_);
  if (told.done.result == TEEC_SUCCESS) {
    if (const TEEC_Result result = memory.take(asked.params, blocks_); result != TEEC_SUCCESS) {
      told.done = refused(result);
    }
  }
  if (told.done.result == TEEC_SUCCESS) {
    take_turn(told.done, [&] {
      told.done.result = core_.world->open_session(from_bytes(asked.ta), client, memory.types(), memory.params(),
                                                   told.session, told.done.origin);
    });
    if (told.done.result == TEEC_SUCCESS) sessions_.push_back(told.session);
    told.params = memory.answer(told.done.origin == TEEC_ORIGIN_TRUSTED_APP);
  }
  answer(request, told);
  return true;
}

bool connection::invoke(const remote::frame& request, int /*file*/) {
  remote::invoke_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  remote::invoke_answer told{refused(TEEC_ERROR_BAD_PARAMETERS), {asked.params.types, {}}};
  call_memory memory(scratch_);
  if (owns(asked.session)) told.done.result = memory.take(asked.params, blocks_);
  if (told.done.result == TEEC_SUCCESS) {
    take_turn(told.done, [&] {
      told.done.result =
          core_.world->invoke(asked.session, asked.command, memory.types(), memory.params(), told.done.origin);
    });
    told.params = memory.answer(told.done.origin == TEEC_ORIGIN_TRUSTED_APP);
  }
  answer(request, told);
  return true;
}

bool connection::close_session(const remote::frame& request, int /*file*/) {
  remote::close_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  remote::plain_answer told{refused(TEEC_ERROR_BAD_PARAMETERS)};
  if (owns(asked.session)) {
    std::erase(sessions_, asked.session);
    core_.world->close_session(asked.session);
    told.done = done;
  }
  answer(request, told);
  return true;
}

bool connection::share_memory(const remote::frame& request, int file) {
  remote::share_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  remote::share_answer told{done, 0};
  if (const TEEC_Result result = blocks_.add(file, asked.size, asked.flags, told.block); result != TEEC_SUCCESS) {
    told.done = refused(result);
  }
  answer(request, told);
  return true;
}

bool connection::release_memory(const remote::frame& request, int /*file*/) {
  remote::release_request asked;
  if (!remote::read_body(request.body, asked)) return false;
  answer(request, remote::plain_answer{blocks_.remove(asked.block) ? done : refused(TEEC_ERROR_BAD_PARAMETERS)});
  return true;
}

bool connection::use_slots(const remote::frame& request, int file) {
  constexpr slot_layout layout{remote::frame_limit};
  remote::empty_request nothing;
  if (!remote::read_body(request.body, nothing)) return false;
  remote::plain_answer told{done};
  if (channel_.has_slots()) {
    told.done = refused(TEEC_ERROR_BAD_STATE);
  } else if (!frame_channel::wants_slots()) {
    told.done = refused(TEEC_ERROR_NOT_SUPPORTED);
  } else if (file < 0) {
    told.done = refused(TEEC_ERROR_OUT_OF_MEMORY);  // this process can't have another descriptor
  } else if (!is_safe_to_share(file, layout.size())) {
    told.done = refused(TEEC_ERROR_BAD_PARAMETERS);
  } else if (auto memory = map_file(file, layout.size())) {
    channel_.use_slots(std::move(*memory), layout, frame_channel::side::answers);
  } else {
    told.done = refused(TEEC_ERROR_OUT_OF_MEMORY);
  }
  answer(request, told);
  return true;
}

}  // namespace hosted_tee
