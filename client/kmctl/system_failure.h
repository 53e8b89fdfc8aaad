// What the system refuses, told with what to try.
#ifndef KEYMASTER_CLIENT_KMCTL_SYSTEM_FAILURE_H_
#define KEYMASTER_CLIENT_KMCTL_SYSTEM_FAILURE_H_

#include <string>

namespace kmctl {

/// advice_on tells what to try about a system error; empty when there is nothing to say beyond its name.
[[nodiscard]] std::string advice_on(int system_error);

/// refuse_file throws failure_error: can't read, write, … the file, because of a system error.
[[noreturn]] void refuse_file(const char* doing, const std::string& name, int system_error);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_SYSTEM_FAILURE_H_
