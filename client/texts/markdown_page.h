// A manual page from one of the project's documents, so that both say the same.
#ifndef KEYMASTER_CLIENT_TEXTS_MARKDOWN_PAGE_H_
#define KEYMASTER_CLIENT_TEXTS_MARKDOWN_PAGE_H_

#include <iosfwd>

namespace texts {

/// write_markdown_page copies a page in mdoc form and puts `document` in where it says `%DOCUMENT%`. Of Markdown it
/// knows what the documents use: headings, paragraphs, tables, lists, `code`, **bold** and links, of which the text
/// stays. The document's title and its list of contents are left out. Throws std::runtime_error when the page has no
/// such line.
void write_markdown_page(std::istream& page, std::istream& document, std::ostream& out);

}  // namespace texts

#endif  // KEYMASTER_CLIENT_TEXTS_MARKDOWN_PAGE_H_
