#include "tee/client/remote_link.h"

#include <algorithm>
#include <cstring>
#include <system_error>

#include "tee/client/client_failure.h"
#include "tee/client/login.h"
#include "tee/client/parcel.h"
#include "tee/client/remote_block.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

using remote::frame_kind;

constexpr std::uint32_t both_ways = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;

// Kept between operations, so that those of usual size don't make it anew each time.
constexpr std::size_t least_staging = std::size_t{256} * 1024;
constexpr std::size_t most_kept_staging = std::size_t{1} * 1024 * 1024;

// The server asks who is on the other side itself; of a group login only the choice among the groups is told.
std::uint32_t group_of(std::uint32_t method, const void* connection_data) {
  std::uint32_t group = 0;
  if (checked_login_method(method, connection_data).group) std::memcpy(&group, connection_data, sizeof group);
  return group;
}

shared_file made_file(std::size_t size) {
  try {
    return make_shared_file(std::max<std::size_t>(size, 1));
  } catch (const std::system_error&) {
    throw client_failure(TEEC_ERROR_OUT_OF_MEMORY);
  }
}

}  // namespace

// In a forked child the mutex may be held by a thread that only the parent has.
std::unique_lock<std::mutex> remote_link::lock() {
  channel_.check_owner();
  return std::unique_lock(mutex_);
}

known_memory remote_link::make_known(std::size_t size, std::uint32_t flags) {
  shared_file made = made_file(size);
  remote::share_answer answer;
  const auto told = static_cast<std::uint32_t>(made.memory.bytes().size());
  channel_.ask(frame_kind::share_memory, remote::share_request{told, flags}, answer, made.file.get());
  if (answer.done.result != TEEC_SUCCESS) throw client_failure(answer.done.result, answer.done.origin);
  return {std::move(made.memory), answer.block};
}

void remote_link::release(std::uint32_t block) {
  remote::plain_answer answer;
  channel_.ask(frame_kind::release_memory, remote::release_request{block}, answer);
}

void remote_link::give_back(std::uint32_t block) noexcept {
  try {
    release(block);
  } catch (const std::exception&) {
    // Without the server there is nobody who still holds it.
  }
}

void remote_link::forget(std::uint32_t block) noexcept {
  try {
    const auto mine = lock();
    release(block);
  } catch (const std::exception&) {
    // The server is gone, or it is the parent who shares it.
  }
}

known_memory& remote_link::staging(std::size_t size) {
  if (!staging_ || staging_->memory.bytes().size() < size) {
    if (staging_) release(staging_->block);
    staging_.reset();
    staging_ = make_known(std::max(size, least_staging), both_ways);
  }
  return *staging_;
}

void remote_link::tidy_staging() noexcept {
  if (!staging_ || staging_->memory.bytes().size() <= most_kept_staging) return;
  give_back(staging_->block);
  staging_.reset();
}

TEEC_Result remote_link::open_session(const TEE_UUID& ta, std::uint32_t method, const void* connection_data,
                                      client_params& params, std::uint32_t& session, std::uint32_t& origin) {
  const std::uint32_t group = group_of(method, connection_data);
  const auto mine = lock();
  parcel sent(params, [this](std::size_t size) -> known_memory& { return staging(size); });
  remote::open_answer answer;
  channel_.ask(frame_kind::open_session, remote::open_request{to_bytes(ta), method, group, sent.slots()}, answer);
  if (!sent.is_answered_by(answer.params)) channel_.break_off();
  origin = answer.done.origin;
  session = answer.session;
  sent.unpack(answer.done, answer.params);
  tidy_staging();
  return answer.done.result;
}

TEEC_Result remote_link::invoke(std::uint32_t session, std::uint32_t command, client_params& params,
                                std::uint32_t& origin) {
  const auto mine = lock();
  parcel sent(params, [this](std::size_t size) -> known_memory& { return staging(size); });
  remote::invoke_answer answer;
  channel_.ask(frame_kind::invoke, remote::invoke_request{session, command, sent.slots()}, answer);
  if (!sent.is_answered_by(answer.params)) channel_.break_off();
  origin = answer.done.origin;
  sent.unpack(answer.done, answer.params);
  tidy_staging();
  return answer.done.result;
}

void remote_link::close_session(std::uint32_t session) {
  const auto mine = lock();
  remote::plain_answer answer;
  channel_.ask(frame_kind::close_session, remote::close_request{session}, answer);
}

std::unique_ptr<shared_block> remote_link::share_own(const TEEC_SharedMemory& memory) {
  const auto mine = lock();
  return std::make_unique<remote_block>(*this, make_known(memory.size, memory.flags), memory);
}

std::unique_ptr<shared_block> remote_link::share_new(const TEEC_SharedMemory& memory) {
  const auto mine = lock();
  return std::make_unique<remote_block>(*this, make_known(memory.size, memory.flags));
}

}  // namespace hosted_tee
