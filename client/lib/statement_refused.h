// Why a statement is not accepted.
#ifndef KEYMASTER_CLIENT_LIB_STATEMENT_REFUSED_H_
#define KEYMASTER_CLIENT_LIB_STATEMENT_REFUSED_H_

#include <stdexcept>
#include <string>
#include <string_view>

namespace keymaster::client {

/// What is checked, in this order.
enum class statement_check {
  layout,     ///< the lengths of text and signature make up the whole
  shape,      ///< the text begins and ends as one of its kind does
  signature,  ///< it is one of the signer's key over the text
  encoding,   ///< the text is UTF-8
  json,       ///< it is an object of texts and whole numbers
  form,       ///< it is written as the TA writes it, to the byte
  members,    ///< it has the members of its kind, in their order
  pub_key,    ///< the key that is told is a sound RSA key
  counter,    ///< the counter has moved
  raw,        ///< the message is the challenge
  fid,        ///< a finger touched that was expected
  uid,        ///< the key was made for this user
  tee_n,      ///< from here on: the device is the one of the factory record
  tee_v,
  fp_n,
  fp_v,
  cpu_id,
};

/// check_name gives the word of a check, which never changes: "layout", "shape", …
[[nodiscard]] std::string_view check_name(statement_check check);

/// Thrown by whoever verifies statements. what() is a sentence about the first check that failed.
class statement_refused : public std::runtime_error {
 public:
  statement_refused(statement_check check, const std::string& why) : std::runtime_error(why), check_(check) {}
  [[nodiscard]] statement_check check() const { return check_; }

 private:
  statement_check check_;
};

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_STATEMENT_REFUSED_H_
