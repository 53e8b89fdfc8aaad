// The relying party: what a statement of the TA says, and whether to believe it. No TEE is needed for that.
//
// A statement proves what its signer said, and no more. It does not tell what else its key may do or where it came
// from, so that a key is to be believed only when one's own client had the TA make it, for signing alone; and only the
// attestation key of the factory's record and keys that were accepted before are to be taken as signers. Whoever asks
// for a finger learns that one touched within three seconds of the signature, not what for: a challenge is to be
// random and used once.
#ifndef KEYMASTER_CLIENT_LIB_STATEMENT_H_
#define KEYMASTER_CLIENT_LIB_STATEMENT_H_

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "client/lib/bytes.h"
#include "client/lib/factory_record.h"
#include "client/lib/rsa_public_key.h"
#include "client/lib/statement_refused.h"

namespace keymaster::client {

/// The two kinds of statements: one of a key's public part, and one of a message that a key signed.
enum class statement_kind { export_key, sign };

/// A statement in its parts: the bytes that are signed (those of a sign statement end with a NUL), and the signature.
struct statement_parts {
  byte_view text;
  byte_view signature;
};

/// split_statement takes a statement apart. Throws statement_refused (layout) when the length in front and a signature
/// of `signature_size` bytes do not make up the whole.
[[nodiscard]] statement_parts split_statement(byte_view statement, std::size_t signature_size);

/// kind_of tells from its two ends which kind a text is; nothing when it is neither.
[[nodiscard]] std::optional<statement_kind> kind_of(byte_view text);

/// The number that stands for no user.
inline constexpr std::uint32_t no_uid = UINT32_MAX;

/// What an export statement must show.
struct export_expectations {
  const rsa_public_key& signer;                    ///< the attestation key, or a key that was accepted before
  std::optional<std::uint32_t> uid = {};           ///< whom the key is for; nothing: nobody in particular
  std::optional<std::uint64_t> last_counter = {};  ///< the last one seen of this device; nothing: not checked
};

struct export_facts {
  rsa_public_key key;
  std::optional<std::uint32_t> uid;
  std::optional<std::uint64_t> counter;      ///< keys need not count
  std::optional<std::uint64_t> counter_gap;  ///< how many values were passed over since `last_counter`
};

/// verify_export_statement believes a statement of a key, or throws statement_refused.
[[nodiscard]] export_facts verify_export_statement(byte_view statement, const export_expectations& expected);

/// told_key gives the key that an export statement tells, whoever signed it: for the one whose own TA just made it.
/// Throws statement_refused for a statement that verify_export_statement would not even read.
[[nodiscard]] rsa_public_key told_key(byte_view statement);

/// What a sign statement must show.
struct sign_expectations {
  const rsa_public_key& signer;                            ///< the key of an accepted export statement
  std::string challenge;                                   ///< what the device was asked to sign
  signature_scheme scheme = {};                            ///< what was agreed when the key was made
  std::optional<std::vector<std::uint32_t>> fingers = {};  ///< one of these must have touched; none: any finger
  std::optional<std::uint32_t> uid = {};                   ///< as for the export statement
  std::optional<std::uint64_t> last_counter = {};          ///< likewise
  const factory_record* device = nullptr;                  ///< null: not checked
};

struct sign_facts {
  std::string raw;
  std::optional<std::uint32_t> fid;
  std::optional<std::uint32_t> uid;
  std::uint64_t counter = 0;
  std::optional<std::uint64_t> counter_gap;
  std::string tee_n, tee_v, fp_n, fp_v, cpu_id;
};

/// verify_sign_statement believes a statement of a signed message, or throws statement_refused; std::invalid_argument
/// when the scheme is none that signs a digest.
[[nodiscard]] sign_facts verify_sign_statement(byte_view statement, const sign_expectations& expected);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_STATEMENT_H_
