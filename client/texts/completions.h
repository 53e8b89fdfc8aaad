// Completions of a command line, in the languages of the shells. Each offers sub-commands, options, the words and files
// that options take, and the program's own options also behind a sub-command.
#ifndef KEYMASTER_CLIENT_TEXTS_COMPLETIONS_H_
#define KEYMASTER_CLIENT_TEXTS_COMPLETIONS_H_

#include <iosfwd>

#include "client/texts/command_tree.h"

namespace texts {

void write_bash_completion(const command_entry& program, std::ostream& out);
void write_zsh_completion(const command_entry& program, std::ostream& out);
void write_fish_completion(const command_entry& program, std::ostream& out);

}  // namespace texts

#endif  // KEYMASTER_CLIENT_TEXTS_COMPLETIONS_H_
