// SPDX-License-Identifier: Apache-2.0
#include "cli/table.h"

#include <algorithm>
#include <numeric>
#include <utility>

namespace Keelgate::CLI {

namespace {

constexpr std::size_t gap = 2;

Array<std::string_view> wordsOf(std::string_view text) {
  Array<std::string_view> words;
  while (!text.empty()) {
    const std::size_t end = std::min(text.find(' '), text.size());
    if (end > 0) words.push_back(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
  return words;
}

/// One row under its columns, the last of which is broken where the width is over.
Array<String> aligned(const Array<String>& cells, const Array<std::size_t>& widths,
                      std::size_t width) {
  String head;
  for (std::size_t i = 0; i + 1 < cells.size(); ++i) {
    head.append(gap, ' ') += cells[i];
    head.append(widths[i] - cells[i].size(), ' ');
  }
  head.append(gap, ' ');
  Array<String> lines = paragraph({cells.back()}, 0, width - head.size());
  for (String& line : lines) {
    line.insert(0, std::exchange(head, String(head.size(), ' ')));
    // Trailing spaces would wrap on a terminal of just this width.
    line.erase(line.find_last_not_of(' ') + 1);
  }
  return lines;
}

}  // namespace

Array<String> paragraph(const Array<String>& cells, std::size_t indent, std::size_t width) {
  Array<String> lines;
  std::size_t space = 0;
  for (const String& cell : cells) {
    for (const std::string_view word : wordsOf(cell)) {
      if (lines.empty() || lines.back().size() + space + word.size() > width) {
        // Less of an indent where the word would not fit behind it.
        const std::size_t room = width > word.size() ? width - word.size() : 0;
        lines.emplace_back(std::min(lines.empty() ? indent : indent + 4, room), ' ');
        space = 0;
      }
      lines.back().append(space, ' ') += word;
      space = 1;
    }
    space = gap;
  }
  if (lines.empty()) lines.emplace_back();
  return lines;
}

String fitted(std::string_view text, std::size_t width) {
  String all;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(line.size() + 1, text.size()));
    if (line.size() <= width) {
      (all += line) += '\n';
      continue;
    }
    for (const String& part : paragraph({String(line)}, line.find_first_not_of(' '), width)) {
      all += part + '\n';
    }
  }
  return all;
}

String emphasised(const String& text, Bool emphasise) {
  return emphasise ? "\033[1m" + text + "\033[0m" : text;
}

Array<std::size_t> Table::columnWidths() const {
  Array<std::size_t> widths(rows_.front().size());
  for (const Array<String>& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
  }
  return widths;
}

String Table::text(std::size_t width, Bool emphasise) const {
  Array<std::size_t> widths = columnWidths();
  const std::size_t head = std::accumulate(widths.begin(), widths.end() - 1, widths.size() * gap);
  std::size_t longest = 0;
  for (const Array<String>& row : rows_) {
    for (const std::string_view word : wordsOf(row.back())) {
      longest = std::max(longest, word.size());
    }
  }
  // A narrow last column would make many lines of few words.
  const std::size_t least = std::max(longest, std::min<std::size_t>(widths.back(), 30));
  const Bool fits = head + least <= width;
  String all;
  for (const Array<String>& row : rows_) {
    // By its place: a row of cells may look like it.
    const Bool heading = &row == &rows_.front();
    for (const String& line : fits ? aligned(row, widths, width) : paragraph(row, gap, width)) {
      all += emphasised(line, heading && emphasise) + '\n';
    }
  }
  return all;
}

}  // namespace Keelgate::CLI
