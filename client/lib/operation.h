// Operations: sign, verify, encrypt and decrypt with a sealed key, in one pass or as a stream.
#ifndef KEYMASTER_CLIENT_LIB_OPERATION_H_
#define KEYMASTER_CLIENT_LIB_OPERATION_H_

#include <functional>
#include <utility>

#include "client/lib/authorizations.h"
#include "client/lib/bytes.h"
#include "client/lib/keys.h"
#include "client/lib/session.h"

namespace keymaster::client {

/// How much input goes into one update when the library splits it.
inline constexpr std::size_t chunk_size = std::size_t{64} * 1024;

/// One operation of the TA. The TA has sixteen places for operations and never times them out; so an operation that is
/// dropped unfinished is aborted. Any failure in update or finish ends the operation in the TA as well.
class operation {
 public:
  /// begin opens `blob` for `purpose`. `parameters` name what the purpose needs (padding, digest, block mode, nonce,
  /// MAC length, auth token). The session must outlive the operation. Throws error.
  [[nodiscard]] static operation begin(session& ta, keymaster_purpose_t purpose, byte_view blob,
                                       const authorizations& parameters, const application& app = {});

  operation(operation&& other) noexcept
      : ta_(std::exchange(other.ta_, nullptr)), handle_(other.handle_), parameters_(std::move(other.parameters_)) {}
  operation& operator=(operation&& other) noexcept;
  operation(const operation&) = delete;
  operation& operator=(const operation&) = delete;
  ~operation() { drop(); }

  /// The handle that an auth token for this very operation must carry as its challenge.
  [[nodiscard]] std::uint32_t handle() const { return handle_; }

  /// What begin answered beside the handle: the nonce that an AES operation works with.
  [[nodiscard]] const authorizations& parameters() const { return parameters_; }

  /// The nonce that begin answered, whether the TA drew it or the caller gave it; empty where there is none. Whoever
  /// decrypts needs it.
  [[nodiscard]] bytes nonce() const { return parameters_.unique_blob(KM_TAG_NONCE).value_or(bytes{}); }

  struct step {
    bytes output;
    std::size_t consumed = 0;
  };

  /// update_once hands one piece of input to the TA, which may take less than all of it. Throws error, and
  /// std::logic_error when the operation has ended.
  step update_once(byte_view input, const authorizations& parameters = {});

  /// update hands over all of `input` in chunks and gives what came out. Throws as update_once; input that the TA does
  /// not take is the error KM_ERROR_INVALID_INPUT_LENGTH.
  bytes update(byte_view input, const authorizations& parameters = {});

  /// add_associated_data has GCM authenticate `data` without encrypting it. It goes to the TA in chunks, so that its
  /// size does not matter, and before any input: afterwards the TA answers KM_ERROR_INVALID_TAG. Throws as update_once.
  void add_associated_data(byte_view data, const authorizations& parameters = {});

  struct result {
    bytes output;
    authorizations parameters;
  };

  /// finish ends the operation and gives its last output: the signature, the MAC, the end of the text. For verify,
  /// `signature` is what to check, and KM_ERROR_VERIFICATION_FAILED says that it does not belong to the input; for all
  /// other purposes it stays empty, the TA takes no input at finish. Throws as update_once.
  result finish(byte_view signature = {}, const authorizations& parameters = {}, std::size_t output_limit = 16384);

  /// abort ends the operation without a result. Throws error.
  void abort();

 private:
  operation(session& ta, const reply& answer);
  reply invoke(keymaster_command_t command, byte_view input, const authorizations& parameters, std::size_t capacity);
  void drop() noexcept;

  session* ta_;  ///< null once the operation has ended
  std::uint32_t handle_;
  authorizations parameters_;
};

/// Fills the buffer and tells how much of it; 0 ends the stream.
using byte_source = std::function<std::size_t(std::span<std::uint8_t>)>;
using byte_sink = std::function<void(byte_view)>;

/// stream feeds an operation from `source` in chunks until it ends, and hands every output to `sink` as it comes.
/// finish is left to the caller. Throws what update and the two functions throw.
void stream(operation& op, const byte_source& source, const byte_sink& sink, const authorizations& parameters = {});

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_OPERATION_H_
