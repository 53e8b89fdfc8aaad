// kmctl_texts: writes what goes with kmctl from its own command line, while it is built.
//
//     kmctl_texts manual PAGE.in > PAGE
//     kmctl_texts document PAGE.in DOCUMENT.md > PAGE
//     kmctl_texts bash|zsh|fish > COMPLETION
#include <CLI/CLI.hpp>
#include <array>
#include <exception>
#include <fstream>
#include <iostream>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>

#include "client/kmctl/application.h"
#include "client/texts/completions.h"
#include "client/texts/manual_page.h"
#include "client/texts/markdown_page.h"

namespace {

struct shell {
  std::string_view name;
  void (*write)(const texts::command_entry& program, std::ostream& out);
};

constexpr std::array<shell, 3> shells{{
    {"bash", texts::write_bash_completion},
    {"zsh", texts::write_zsh_completion},
    {"fish", texts::write_fish_completion},
}};

std::ifstream opened(const char* name) {
  std::ifstream file(name);
  if (!file) throw std::runtime_error(std::string("cannot read ") + name);
  return file;
}

bool write(std::span<char* const> words) {
  if (words.size() == 4 && std::string_view(words[1]) == "document") {
    std::ifstream page = opened(words[2]);
    std::ifstream document = opened(words[3]);
    texts::write_markdown_page(page, document, std::cout);
    return true;
  }
  kmctl::context context;
  const texts::command_entry program = texts::describe(*kmctl::make_application(context));
  if (words.size() == 3 && std::string_view(words[1]) == "manual") {
    std::ifstream page = opened(words[2]);
    texts::write_manual_page(page, program, std::cout);
    return true;
  }
  for (const shell& known : shells) {
    if (words.size() != 2 || known.name != words[1]) continue;
    known.write(program, std::cout);
    return true;
  }
  return false;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    if (write({argv, static_cast<std::size_t>(argc)}) && std::cout.flush()) return 0;
    std::cerr << "usage: kmctl_texts manual PAGE.in | document PAGE.in DOCUMENT.md | bash | zsh | fish\n";
  } catch (const std::exception& failed) {
    std::cerr << "kmctl_texts: " << failed.what() << "\n";
  }
  return 1;
}
