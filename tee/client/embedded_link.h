// A device in this process: TAs work on the client's own memory, and nothing is copied.
#ifndef TEE_CLIENT_EMBEDDED_LINK_H_
#define TEE_CLIENT_EMBEDDED_LINK_H_

#include <memory>

#include "tee/client/tee_link.h"
#include "tee/runtime/secure_world.h"

namespace hosted_tee {

class embedded_link final : public tee_link {
 public:
  explicit embedded_link(std::shared_ptr<secure_world> world) : world_(std::move(world)) {}

  TEEC_Result open_session(const TEE_UUID& ta, std::uint32_t method, const void* connection_data, client_params& params,
                           std::uint32_t& session, std::uint32_t& origin) override;
  TEEC_Result invoke(std::uint32_t session, std::uint32_t command, client_params& params,
                     std::uint32_t& origin) override;
  void close_session(std::uint32_t session) override;
  std::unique_ptr<shared_block> share_own(const TEEC_SharedMemory& memory) override;
  std::unique_ptr<shared_block> share_new(const TEEC_SharedMemory& memory) override;

 private:
  std::shared_ptr<secure_world> world_;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_EMBEDDED_LINK_H_
