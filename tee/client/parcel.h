// The parameters of one operation on their way to a server and back.
#ifndef TEE_CLIENT_PARCEL_H_
#define TEE_CLIENT_PARCEL_H_

#include <array>
#include <functional>
#include <span>

#include "tee/client/parameters.h"
#include "tee/client/remote_link.h"
#include "tee/remote/parameters.h"

namespace hosted_tee {

class remote_block;

/// What is small is carried in the frames, and what isn't lies in shared memory.
class parcel {
 public:
  /// `staging` gives shared memory of at least so many bytes, for references that don't fit into a frame. Throws
  /// client_failure: TEEC_ERROR_BAD_PARAMETERS for a part of shared memory beyond what was registered,
  /// TEEC_ERROR_EXCESS_DATA for temporary references of more than TEEC_CONFIG_SHAREDMEM_MAX_SIZE bytes together.
  parcel(client_params& params, const std::function<known_memory&(std::size_t)>& staging);

  [[nodiscard]] const remote::request_slots& slots() const { return slots_; }

  /// is_answered_by tells whether the answer has the request's parameters, and no more memory than they have room for.
  [[nodiscard]] bool is_answered_by(const remote::answer_slots& answer) const;

  /// unpack puts values, sizes and memory where they belong; what the server refused stays as it was. For answers that
  /// belong to the request.
  void unpack(const remote::outcome& done, const remote::answer_slots& answer);

 private:
  /// Shared memory that stands for the client's own. It is copied before also where nothing goes in: else what the TA
  /// leaves unwritten would come back with what an earlier operation had there.
  struct copied_memory {
    std::span<std::uint8_t> shared;
    std::uint8_t* own = nullptr;
  };

  void pack_memory(std::size_t slot, const remote_block* block);
  void carry(std::size_t slot);
  void stage(std::size_t slot, known_memory& memory, std::size_t& used);
  void unpack_memory(std::size_t slot, const remote::answer_slot& answer, bool reached_ta);

  client_params& params_;
  remote::request_slots slots_;
  std::array<copied_memory, 4> copies_{};
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_PARCEL_H_
