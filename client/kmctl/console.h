// Standard input, output and error. What is printed is written at once, so that no failure goes unseen.
#ifndef KEYMASTER_CLIENT_KMCTL_CONSOLE_H_
#define KEYMASTER_CLIENT_KMCTL_CONSOLE_H_

#include <string_view>

namespace kmctl {

/// prepare_streams makes sure that the three streams are open, before anything else opens a file: one that the caller
/// has closed would become that file, and what is printed would go into it. Writing to and reading from such a stream
/// fails, except that standard error swallows what it gets. A file that grows beyond its limit becomes a failure to
/// write in place of the signal that would end the program.
void prepare_streams() noexcept;

/// print writes to standard output. Throws failure_error.
void print(std::string_view text);

/// complain writes to standard error. When that can't be done, there is nobody left to tell: it is passed over.
void complain(std::string_view text) noexcept;

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_CONSOLE_H_
