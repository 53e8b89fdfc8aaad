#include "tee/client/embedded_link.h"

#include <algorithm>
#include <vector>

#include "tee/client/login.h"

namespace hosted_tee {
namespace {

class heap_block final : public shared_block {
 public:
  // An empty block has an address too.
  heap_block(std::shared_ptr<tee_link> owner, std::size_t size)
      : shared_block(std::move(owner)), bytes_(std::max<std::size_t>(size, 1)) {}
  [[nodiscard]] void* allocated() const override { return bytes_.data(); }

 private:
  mutable std::vector<std::uint8_t> bytes_;
};

/// Memory of the client's own, of which only whose it is needs to be known.
class own_block final : public shared_block {
 public:
  using shared_block::shared_block;
  [[nodiscard]] void* allocated() const override { return nullptr; }
};

}  // namespace

TEEC_Result embedded_link::open_session(const TEE_UUID& ta, std::uint32_t method, const void* connection_data,
                                        client_params& params, std::uint32_t& session, std::uint32_t& origin) {
  const TEE_Identity client = login_identity(method, connection_data);
  return world_->open_session(ta, client, params.types(), params.slots(), session, origin);
}

TEEC_Result embedded_link::invoke(std::uint32_t session, std::uint32_t command, client_params& params,
                                  std::uint32_t& origin) {
  return world_->invoke(session, command, params.types(), params.slots(), origin);
}

void embedded_link::close_session(std::uint32_t session) {
  world_->close_session(session);
}

std::unique_ptr<shared_block> embedded_link::share_own(const TEEC_SharedMemory& /*memory*/) {
  return std::make_unique<own_block>(shared_from_this());
}

std::unique_ptr<shared_block> embedded_link::share_new(const TEEC_SharedMemory& memory) {
  return std::make_unique<heap_block>(shared_from_this(), memory.size);
}

}  // namespace hosted_tee
