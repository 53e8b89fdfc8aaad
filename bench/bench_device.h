// A device with one session to the Keymaster TA, reached through the Client API with buffers that are made once: what
// is measured is the call, and not the caller.
#ifndef BENCH_BENCH_DEVICE_H_
#define BENCH_BENCH_DEVICE_H_

#include <cstdint>
#include <filesystem>
#include <initializer_list>
#include <memory>
#include <utility>
#include <vector>

#include "tee/runtime/secure_world.h"
#include "tee_client_api.h"

namespace bench {

using bytes = std::vector<std::uint8_t>;

void append_u32(bytes& body, std::uint32_t value);
void append_block(bytes& body, const bytes& block);  ///< behind its length
std::uint32_t u32_at(const bytes& data, std::size_t offset);

/// marshal gives the byte form of parameters that are numbers.
bytes marshal(std::initializer_list<std::pair<std::uint32_t, std::uint64_t>> params);

/// rsa_sign_key asks for a key that signs with PKCS#1 v1.5 and SHA-256; rsa_sign_params for an operation that does.
bytes rsa_sign_key(std::uint32_t bits);
bytes rsa_sign_params();

/// One command's outcome. `a` is the Keymaster error, `b` the command's number, `size` what was written to the
/// response.
struct reply {
  TEEC_Result result = 0;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  std::size_t size = 0;
};

/// A device on a state folder of its own, which goes with it. What fails throws std::runtime_error.
class bench_device {
 public:
  bench_device();
  bench_device(const bench_device&) = delete;
  bench_device& operator=(const bench_device&) = delete;
  ~bench_device();

  [[nodiscard]] hosted_tee::secure_world& world() { return *world_; }
  [[nodiscard]] hosted_tee::accounting accounting() const;

  /// reopen ends the TA's instance and starts another.
  void reopen();

  /// invoke sends a command; null leaves the slot of the request or the response out.
  reply invoke(std::uint32_t command, std::uint32_t a, const bytes* request, bytes* response);

  /// must_invoke is invoke for commands that have to succeed.
  reply must_invoke(std::uint32_t command, std::uint32_t a, const bytes* request, bytes* response);

  /// generate answers the sealed blob of a fresh key.
  bytes generate(const bytes& params);

 private:
  void open();
  void close();

  std::filesystem::path folder_;
  std::shared_ptr<hosted_tee::secure_world> world_;
  TEEC_Context context_ = {};
  TEEC_Session session_ = {};
};

/// A signature by the TA in three commands, with the blob handed over each time.
class ta_signer {
 public:
  ta_signer(bench_device& device, const bytes& blob, const bytes& message);
  const bytes& sign();

  /// begin starts an operation without going on, and answers its handle.
  std::uint32_t begin();

 private:
  bench_device& device_;
  bytes begin_request_, update_request_, finish_request_;
  bytes response_, signature_;
};

}  // namespace bench

#endif  // BENCH_BENCH_DEVICE_H_
