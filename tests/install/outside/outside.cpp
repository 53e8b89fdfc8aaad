// A program of somebody else's: makes a key, signs with it, has the signature verified, and reads a refusal.
#include <keymaster/client/capabilities.h>
#include <keymaster/client/operation.h>

#include <cstdlib>
#include <iostream>
#include <string_view>

using namespace keymaster;
using namespace keymaster::client;

int main(int argc, char** argv) {
  if (argc != 2) return EXIT_FAILURE;
  try {
    connection tee(argv[1]);
    session ta(tee);
    std::cout << get_capabilities(ta).size() << " algorithms\n";

    const authorizations digest = authorizations{}.digest({KM_DIGEST_SHA_2_256});
    const key_blob blob = generate_key(
        ta,
        authorizations{digest}.algorithm(KM_ALGORITHM_EC).key_size(256).purpose({KM_PURPOSE_SIGN}).no_auth_required());
    const byte_view message = as_bytes("Dear reader");
    operation sign = operation::begin(ta, KM_PURPOSE_SIGN, blob, digest);
    (void)sign.update(message);
    const bytes signature = sign.finish().output;

    operation verify = operation::begin(ta, KM_PURPOSE_VERIFY, blob, digest);
    (void)verify.update(message);
    (void)verify.finish(signature);
    std::cout << "verified\n";

    operation other = operation::begin(ta, KM_PURPOSE_VERIFY, blob, digest);
    (void)other.update(as_bytes("dear reader"));
    (void)other.finish(signature);
  } catch (const error& refused) {
    std::cout << "refused: " << refused.facts().keymaster_error << '\n';
    return EXIT_SUCCESS;
  }
  return EXIT_FAILURE;
}
