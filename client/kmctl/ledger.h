// What a relying party remembers of a device: the last counter of its statements.
#ifndef KEYMASTER_CLIENT_KMCTL_LEDGER_H_
#define KEYMASTER_CLIENT_KMCTL_LEDGER_H_

#include <cstdint>
#include <optional>
#include <string>

#include "client/lib/bytes.h"

namespace kmctl {

/// A file with a JSON object: "counter", and "device_id" in hexadecimal digits once the device is known. Who holds the
/// ledger holds a lock on its folder, so that two verifiers can't both accept the same statement. Not copyable.
class ledger {
 public:
  /// Takes the lock, waiting for it if need be, and reads the file; one that does not exist is an empty ledger. Throws
  /// failure_error.
  explicit ledger(std::string path);
  ledger(const ledger&) = delete;
  ledger& operator=(const ledger&) = delete;
  ~ledger();

  /// The last counter; nothing in an empty ledger.
  [[nodiscard]] std::optional<std::uint64_t> counter() const { return counter_; }

  /// expect_device refuses the ledger of another device, and makes an unbound one that device's with the next record.
  /// Throws usage_error.
  void expect_device(keymaster::client::byte_view id);

  /// record writes the counter down, whole or not at all. Throws failure_error.
  void record(std::uint64_t counter);

 private:
  void read();

  std::string path_;
  int lock_;
  std::optional<std::uint64_t> counter_;
  std::string device_id_;  ///< empty: not known
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_LEDGER_H_
