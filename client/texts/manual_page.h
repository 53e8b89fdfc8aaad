// The manual page's part that follows from the command line.
#ifndef KEYMASTER_CLIENT_TEXTS_MANUAL_PAGE_H_
#define KEYMASTER_CLIENT_TEXTS_MANUAL_PAGE_H_

#include <iosfwd>
#include <string>

#include "client/texts/command_tree.h"

namespace texts {

/// write_manual_page copies a page in mdoc form and puts in what a person need not write: the line `%OPTIONS%` becomes
/// the list of the program's own options, the line `%COMMANDS%` a subsection for every sub-command with its arguments,
/// options, explanations and examples. Throws std::runtime_error when one of the two lines is missing.
void write_manual_page(std::istream& page, const command_entry& program, std::ostream& out);

}  // namespace texts

#endif  // KEYMASTER_CLIENT_TEXTS_MANUAL_PAGE_H_
