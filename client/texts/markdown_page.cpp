#include "client/texts/markdown_page.h"

#include <algorithm>
#include <istream>
#include <ostream>
#include <regex>
#include <stdexcept>
#include <string>
#include <vector>

#include "client/texts/roff.h"

namespace texts {
namespace {

// `code` and **bold** in bold, links as their text. A mark in front of a word keeps roff from hyphenating names.
std::string inline_text(const std::string& text) {
  static const std::regex link(R"(\[([^\]]*)\]\([^)]*\))");
  static const std::regex strong("(\\(?)(?:`([^`]*)`|\\*\\*([^*]*)\\*\\*)");
  static const std::regex name(R"((^|\s)(\(?\w*_\w+))");
  const std::string plain = std::regex_replace(roff_sentences(text), link, "$1");
  return std::regex_replace(std::regex_replace(plain, strong, "\\%$1\\fB$2$3\\fP"), name, "$1\\%$2");
}

std::string trimmed(const std::string& text) {
  const std::size_t first = text.find_first_not_of(' ');
  return first == std::string::npos ? "" : text.substr(first, text.find_last_not_of(' ') + 1 - first);
}

std::vector<std::string> cells_of(const std::string& row) {
  static const std::regex bar(R"(\|)");
  const std::size_t first = row.find('|') + 1;
  const std::string inside = row.substr(first, row.rfind('|') - first);
  std::vector<std::string> cells;
  for (std::sregex_token_iterator at(inside.begin(), inside.end(), bar, -1), end; at != end; ++at) {
    cells.push_back(trimmed(*at));
  }
  return cells;
}

std::string line_of(const std::string& text) {
  const std::string line = inline_text(text);
  return line.substr(0, line.size() - 1);
}

// The document is read line by line; what a line belongs to shows in how it begins.
class page_writer {
 public:
  explicit page_writer(std::ostream& out) : out_(out) {}

  void take(const std::string& line) {
    static const std::regex heading("^(#+) (.*)$");
    static const std::regex item("^(-|[0-9]+\\.) +(.*)$");
    std::smatch found;
    if (std::regex_match(line, found, heading)) {
      end_list();
      take_heading(found[1].length(), found[2]);
    } else if (trimmed(line).starts_with('|')) {
      end_paragraph();
      rows_.push_back(cells_of(line));
    } else if (line.empty()) {
      end_block();
    } else if (std::regex_match(line, found, item)) {
      take_item(found[1] == "-" ? "-bullet" : "-enum", found[2]);
    } else {
      if (!line.starts_with(' ') && paragraph_.empty()) end_list();
      paragraph_ += (paragraph_.empty() ? "" : " ") + trimmed(line);
    }
  }

  void end_list() {
    end_block();
    if (!list_.empty()) out_ << ".El\n";
    list_.clear();
  }

 private:
  void take_heading(std::ptrdiff_t level, std::string text) {
    if (level == 1) return;
    if (level == 2) {
      std::transform(text.begin(), text.end(), text.begin(), [](char c) { return c >= 'a' && c <= 'z' ? c - 32 : c; });
    }
    out_ << (level == 2 ? ".Sh " : ".Ss ") << inline_text(text);
    under_heading_ = true;
  }

  void take_item(const std::string& kind, const std::string& text) {
    static const std::regex contents(R"(^\[[^\]]*\]\(#[^)]*\)$)");
    end_block();
    if (std::regex_match(text, contents)) return;
    if (list_ != kind) {
      if (!list_.empty()) out_ << ".El\n";
      out_ << ".Bl " << kind << " -compact\n";
      list_ = kind;
    }
    out_ << ".It\n";
    paragraph_ = text;
    in_item_ = true;
  }

  void end_block() {
    end_paragraph();
    end_table();
  }

  void end_paragraph() {
    if (paragraph_.empty()) return;
    if (!in_item_ && !under_heading_) out_ << ".Pp\n";
    out_ << inline_text(paragraph_);
    paragraph_.clear();
    in_item_ = under_heading_ = false;
  }

  void end_table() {
    if (rows_.size() < 2) return;
    rows_.erase(rows_.begin() + 1);  // the dashes below the names of the columns
    if (is_wide()) {
      write_list();
    } else {
      write_table();
    }
    rows_.clear();
    under_heading_ = false;
  }

  // A table that is too wide for a terminal: an entry for each row, which names what it tells.
  void write_list() {
    out_ << ".Bl -tag -width Ds -compact\n";
    for (auto row = rows_.begin() + 1; row != rows_.end(); ++row) {
      // Of many columns the first two are names; of two, the second tells.
      const std::size_t names = row->size() > 2 ? 2 : 1;
      std::string tag = (*row)[0];
      if (names == 2 && !(*row)[1].empty()) tag += (tag.empty() ? "" : " ") + (*row)[1];
      out_ << (tag.empty() ? ".Pp" : ".It " + line_of(tag)) << "\n";  // a row without names goes on with the last one
      std::string facts;
      for (std::size_t i = names; i < row->size(); ++i) {
        if ((*row)[i].empty()) continue;
        facts += (facts.empty() ? "" : "; ") + rows_.front()[i] + ": " + (*row)[i];
      }
      out_ << inline_text(facts);
    }
    out_ << ".El\n";
  }

  // Columns of short cells are as wide as those, the others share the width that is left, and wrap.
  void write_table() {
    const std::vector<bool> wraps = wrapping_columns();
    out_ << (under_heading_ ? "" : ".Pp\n") << ".TS\n";
    for (std::size_t i = 0; i < wraps.size(); ++i) out_ << (i == 0 ? "" : " ") << (wraps[i] ? "lx" : "l");
    out_ << ".\n";
    for (std::size_t i = 0; i < rows_.size(); ++i) {
      write_row(rows_[i], wraps);
      if (i == 0) out_ << "_\n";
    }
    out_ << ".TE\n";
  }

  static constexpr std::size_t short_cell = 28;

  // Whether the table leaves a terminal too little room to wrap its text in: it has many columns, or long names.
  [[nodiscard]] bool is_wide() const {
    const std::vector<bool> wraps = wrapping_columns();
    if (wraps.size() > 3) return wraps.size() > 4 || std::find(wraps.begin(), wraps.end(), true) != wraps.end();
    return std::any_of(rows_.begin(), rows_.end(), [](const auto& row) {
      return row[0].size() > short_cell && row[0].find(' ') == std::string::npos;
    });
  }

  [[nodiscard]] std::vector<bool> wrapping_columns() const {
    std::vector<bool> wraps(rows_.front().size(), false);
    for (const auto& row : rows_) {
      for (std::size_t i = 0; i < std::min(row.size(), wraps.size()); ++i) {
        wraps[i] = wraps[i] || (row[i].size() > short_cell && row[i].find(' ') != std::string::npos);
      }
    }
    return wraps;
  }

  void write_row(const std::vector<std::string>& cells, const std::vector<bool>& wraps) {
    for (std::size_t i = 0; i < wraps.size(); ++i) {
      const std::string cell = i < cells.size() ? cells[i] : "";
      out_ << (i == 0 ? "" : "\t");
      if (wraps[i] && !cell.empty()) {
        out_ << "T{\n" << inline_text(cell) << "T}";
      } else {
        out_ << line_of(cell);
      }
    }
    out_ << "\n";
  }

  std::ostream& out_;
  std::string paragraph_;
  std::vector<std::vector<std::string>> rows_;
  std::string list_;           ///< the kind of the list that is open
  bool in_item_ = false;       ///< the paragraph begins an item of it
  bool under_heading_ = true;  ///< nothing stands below the heading yet
};

}  // namespace

void write_markdown_page(std::istream& page, std::istream& document, std::ostream& out) {
  bool filled = false;
  for (std::string line; std::getline(page, line);) {
    if (line != "%DOCUMENT%") {
      out << line << "\n";
      continue;
    }
    page_writer writer(out);
    for (std::string text; std::getline(document, text);) writer.take(text);
    writer.end_list();
    filled = true;
  }
  if (!filled) throw std::runtime_error("the page has no place for the document");
}

}  // namespace texts
