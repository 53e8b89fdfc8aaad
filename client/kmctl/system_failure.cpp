#include "client/kmctl/system_failure.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <system_error>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

struct advice {
  int system_error;
  const char* text;
};

constexpr const char* check_permissions = "check who may read and write it, and its folder: ls -ld";
constexpr const char* make_room = "make room, or choose another place";

constexpr std::array advices = std::to_array<advice>({
    {ENOENT, "check the name, and make the folder if it is not there"},
    {ENOTDIR, "a part of the name is not a folder: check it"},
    {EISDIR, "name a file, not a folder"},
    {EACCES, check_permissions},
    {EPERM, check_permissions},
    {EROFS, "the file system takes no changes: choose another place"},
    {ENOSPC, make_room},
    {EDQUOT, make_room},
    {EFBIG, "the file would be larger than allowed: see ulimit -f, or choose another place"},
    {ELOOP, "the links lead in a circle: mend them"},
    {ENAMETOOLONG, "choose a shorter name"},
    {EBADF, "it is closed: open or redirect it"},
    {EIO, "check the disk or the terminal"},
    {EMFILE, "too many files are open: see ulimit -n"},
    {ENFILE, "too many files are open: end other programs"},
    {ENOMEM, "end other programs to free memory"},
    {ETXTBSY, "the file is a program that runs: choose another name"},
    {EAGAIN, "it was opened not to be waited for: pass the data through a file or a pipe"},
    {EPIPE, "the program that reads it has ended: look at what that said"},
    {ENXIO, "nothing reads the other end: start that first"},
});

}  // namespace

std::string advice_on(int system_error) {
  const auto* const row = std::ranges::find(advices, system_error, &advice::system_error);
  return row == advices.end() ? std::string{} : std::string(row->text);
}

void refuse_file(const char* doing, const std::string& name, int system_error) {
  throw failure_error(fmt::format("can't {} {}: {}", doing, name, std::generic_category().message(system_error)),
                      advice_on(system_error));
}

}  // namespace kmctl
