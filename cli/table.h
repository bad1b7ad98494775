// SPDX-License-Identifier: Apache-2.0
/// Text tables that fit a width.
///
///     Table table({"NAME", "TYPE"}, outputWidth(), outputHasColour());
///     table.add({"command", "int"});
///     console.print(table.text());
///
/// For ASCII, where a byte is a column, which all names here are. Values; nothing throws but
/// std::bad_alloc.
#pragma once

#include <keelgate/values.h>

#include <cstddef>

namespace Keelgate::CLI {

/// Rows of cells under their headings, indented by two columns. Where the widest columns do not
/// fit, their cells are wrapped, at spaces where they can be.
class Table {
 public:
  /// `emphasise`: headings stand out.
  Table(Array<String> headings, std::size_t width, Bool emphasise);

  /// As many cells as there are headings.
  void add(Array<String> cells);

  /// All of it, each line with its newline and without trailing spaces.
  [[nodiscard]] String text() const;

 private:
  [[nodiscard]] Array<std::size_t> columnWidths() const;

  Array<Array<String>> rows_;
  std::size_t width_;
  Bool emphasise_;
};

/// `text` as it stands out on a terminal, if it shall.
String emphasised(const String& text, Bool emphasise);

}  // namespace Keelgate::CLI
