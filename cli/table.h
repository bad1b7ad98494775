// SPDX-License-Identifier: Apache-2.0
/// Text for a width in columns: paragraphs, and tables.
///
///     Table table({"NAME", "TYPE"});
///     table.add({"command", "int"});
///     console.print(table.text(outputWidth(), outputHasColour()));
///
/// Lines are broken at spaces and never within a word: somebody will search for it, or copy it.
/// Where a table is too wide its rows become paragraphs.
///
/// For ASCII, where a byte is a column, which all names here are. Values; nothing throws but
/// std::bad_alloc.
#pragma once

#include <keelgate/values.h>

#include <cstddef>
#include <string_view>

namespace Keelgate::CLI {

/// The words of the cells, two spaces between cells. The first line is indented by `indent`, the
/// others by four columns more.
Array<String> paragraph(const Array<String>& cells, std::size_t indent, std::size_t width);

/// `text` with the lines broken that are too wide, each as a paragraph of its own indent.
String fitted(std::string_view text, std::size_t width);

/// `text` as it stands out on a terminal, if it shall.
String emphasised(const String& text, Bool emphasise);

/// Rows of cells under their headings, indented by two columns.
class Table {
 public:
  explicit Table(Array<String> headings) : rows_{std::move(headings)} {}

  /// As many cells as there are headings.
  void add(Array<String> cells) { rows_.push_back(std::move(cells)); }

  /// All of it, each line with its newline and without trailing spaces. `emphasise`: headings stand
  /// out.
  [[nodiscard]] String text(std::size_t width, Bool emphasise) const;

 private:
  [[nodiscard]] Array<std::size_t> columnWidths() const;

  Array<Array<String>> rows_;
};

}  // namespace Keelgate::CLI
