// A device with one session to the Keymaster TA, reached through the Client API with buffers that are made once: what
// is measured is the call, and not the caller.
#ifndef BENCH_BENCH_DEVICE_H_
#define BENCH_BENCH_DEVICE_H_

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "bench/wire.h"
#include "tee/runtime/secure_world.h"
#include "tee_client_api.h"

namespace bench {

/// One command's outcome. `a` is the Keymaster error, `b` the command's number, `size` what was written to the
/// response.
struct reply {
  TEEC_Result result = 0;
  std::uint32_t a = 0;
  std::uint32_t b = 0;
  std::size_t size = 0;
};

/// A folder that goes with its owner.
class temporary_folder {
 public:
  temporary_folder();
  temporary_folder(const temporary_folder&) = delete;
  temporary_folder& operator=(const temporary_folder&) = delete;
  ~temporary_folder();
  [[nodiscard]] const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

/// A device in a state folder (a given one, which stays, or one of its own), or behind a server. What fails throws
/// std::runtime_error.
class bench_device {
 public:
  bench_device();
  explicit bench_device(std::filesystem::path state);
  explicit bench_device(std::string context_name);  ///< behind a server: it has no world() and no accounting() here
  bench_device(const bench_device&) = delete;
  bench_device& operator=(const bench_device&) = delete;
  ~bench_device();

  [[nodiscard]] TEEC_Context& context() { return context_; }
  [[nodiscard]] TEEC_Session& session() { return session_; }
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

  /// import_key answers the sealed blob of `material`, which is in the algorithm's own layout.
  bytes import_key(const bytes& params, const bytes& material);

 private:
  void start(const std::filesystem::path& state);
  void open();
  void close();

  std::optional<temporary_folder> own_folder_;
  std::string context_name_;
  std::shared_ptr<hosted_tee::secure_world> world_;
  TEEC_Context context_ = {};
  TEEC_Session session_ = {};
};

}  // namespace bench

#endif  // BENCH_BENCH_DEVICE_H_
