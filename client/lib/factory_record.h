// What the factory notes of each device, and who verifies its statements must know: the public half of the attestation
// key, and the facts that the statements repeat.
#ifndef KEYMASTER_CLIENT_LIB_FACTORY_RECORD_H_
#define KEYMASTER_CLIENT_LIB_FACTORY_RECORD_H_

#include <string>

#include "client/lib/bytes.h"

namespace keymaster::client {

/// One device. The texts are what its TAs tell: UTF-8 without a NUL.
struct factory_record {
  bytes device_id;
  std::string cpu_id;
  std::string tee_n;  ///< the maker of the trusted OS
  std::string tee_v;  ///< its version
  std::string fp_n;   ///< the name of the fingerprint sensor
  std::string fp_v;   ///< its version
  std::string attk;   ///< the public attestation key, as PEM

  friend bool operator==(const factory_record&, const factory_record&) = default;
};

/// write_factory_record gives the record as a JSON object with the members of factory_record, in their order, the
/// device id in hexadecimal digits. Throws format_error when a text is not UTF-8 or holds a NUL.
[[nodiscard]] std::string write_factory_record(const factory_record& record);

/// read_factory_record reads that form. Throws format_error when a member is missing, unknown, given twice or of
/// another form; whether the PEM holds a key is found out by who uses it.
[[nodiscard]] factory_record read_factory_record(byte_view file);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_FACTORY_RECORD_H_
