// What a service tells the one who started it.
#ifndef TEE_SERVER_NOTIFY_H_
#define TEE_SERVER_NOTIFY_H_

#include <string_view>

namespace hosted_tee {

/// notify_manager sends `state` ("READY=1\nSTATUS=…") by the protocol of sd_notify(3): one packet to the socket that
/// NOTIFY_SOCKET names, with an @ in front for one without a file. Without the variable it does nothing. Answers false
/// when the packet could not be sent.
bool notify_manager(std::string_view state);

}  // namespace hosted_tee

#endif  // TEE_SERVER_NOTIFY_H_
