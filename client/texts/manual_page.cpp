#include "client/texts/manual_page.h"

#include <algorithm>
#include <istream>
#include <ostream>
#include <sstream>
#include <stdexcept>
#include <vector>

#include "client/texts/roff.h"

namespace texts {
namespace {

std::string capitalised(std::string text) {
  if (!text.empty() && text[0] >= 'a' && text[0] <= 'z') text[0] = static_cast<char>(text[0] - 'a' + 'A');
  return text;
}

// A help's text is a few words without a full stop; a manual's is a sentence.
std::string as_sentence(const std::string& words) {
  return roff_sentences(capitalised(words) + (words.ends_with('.') ? "" : "."));
}

void write_option(const option_entry& option, std::ostream& out) {
  out << ".It";
  for (std::size_t i = 0; i < option.names.size(); ++i) {
    out << (i == 0 ? " " : " , ") << "Fl " << roff_escaped(option.names[i].substr(1));
  }
  if (!option.value.empty()) out << " Ar " << option.value;
  out << "\n" << as_sentence(option.description);
}

void write_options(const std::vector<option_entry>& options, std::ostream& out) {
  std::string group;
  bool in_list = false;
  for (const option_entry& option : options) {
    if (option.group != group || !in_list) {
      if (in_list) out << ".El\n";
      if (option.group != "Options") out << ".Pp\n" << roff_escaped(option.group) << ":\n";
      out << ".Bl -tag -width Ds\n";
      in_list = true;
      group = option.group;
    }
    write_option(option, out);
  }
  if (in_list) out << ".El\n";
}

// Help that everything has is not worth a line in each place.
std::vector<option_entry> without_help(const std::vector<option_entry>& options) {
  std::vector<option_entry> out;
  std::copy_if(options.begin(), options.end(), std::back_inserter(out), [](const option_entry& option) {
    return std::find(option.names.begin(), option.names.end(), "--help") == option.names.end();
  });
  return out;
}

// Indented lines stand as they are, others are running text.
void write_footer(const std::string& footer, std::ostream& out) {
  std::istringstream lines(footer);
  std::string prose;
  bool as_is = false;
  const auto end_prose = [&] {
    if (!prose.empty()) out << ".Pp\n" << roff_sentences(prose);
    prose.clear();
  };
  for (std::string line; std::getline(lines, line);) {
    const bool indented = line.starts_with("  ");
    if (indented && !as_is) {
      end_prose();
      out << ".Bd -literal -offset indent -compact\n";
    } else if (!indented && as_is) {
      out << ".Ed\n";
    }
    as_is = indented;
    if (indented) {
      out << roff_escaped(line.substr(2)) << "\n";
    } else if (line.empty()) {
      end_prose();
    } else {
      prose += (prose.empty() ? "" : " ") + line;
    }
  }
  end_prose();
  if (as_is) out << ".Ed\n";
}

void write_command(const command_entry& command, const std::string& parent, std::ostream& out) {
  const std::string path = parent + " " + command.name;
  if (!command.commands.empty()) {
    for (const command_entry& below : command.commands) write_command(below, path, out);
    return;
  }
  out << ".Ss " << roff_escaped(path) << "\n.Nm\n.Cm" << roff_escaped(path.substr(path.find(' ')));
  if (!without_help(command.options).empty()) out << "\n.Op Ar option ...";
  for (const argument_entry& argument : command.arguments) {
    out << (argument.required ? "\n.Ar " : "\n.Op Ar ") << argument.name;
  }
  out << "\n.Pp\n" << as_sentence(command.description);
  if (!command.arguments.empty()) out << ".Bl -tag -width Ds\n";
  for (const argument_entry& argument : command.arguments) {
    out << ".It Ar " << argument.name << "\n" << as_sentence(argument.description);
  }
  if (!command.arguments.empty()) out << ".El\n";
  write_options(without_help(command.options), out);
  write_footer(command.footer, out);
}

}  // namespace

void write_manual_page(std::istream& page, const command_entry& program, std::ostream& out) {
  int filled = 0;
  for (std::string line; std::getline(page, line);) {
    if (line == "%OPTIONS%") {
      write_options(program.options, out);
      ++filled;
    } else if (line == "%COMMANDS%") {
      for (const command_entry& command : program.commands) write_command(command, program.name, out);
      ++filled;
    } else {
      out << line << "\n";
    }
  }
  if (filled != 2) throw std::runtime_error("the page has no place for the options or for the sub-commands");
}

}  // namespace texts
