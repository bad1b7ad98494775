// SPDX-License-Identifier: Apache-2.0
/// Columns are as wide as their longest cell, and give way from the widest where that is too much.
#include "cli/table.h"

#include <algorithm>
#include <numeric>
#include <utility>

namespace Keelgate::CLI {

namespace {

constexpr std::size_t gap = 2;
/// Below this a column is no longer readable; a narrower terminal wraps the lines itself.
constexpr std::size_t narrowestColumn = 8;

/// Takes the first line of at most `width` characters off `text`.
String takeLine(String& text, std::size_t width) {
  if (text.size() <= width) return std::exchange(text, {});
  const std::size_t space = text.rfind(' ', width);
  // A word that is longer than its column is cut: it has to go somewhere.
  const Bool atSpace = space != String::npos && space > 0;
  String line = text.substr(0, atSpace ? space : width);
  text.erase(0, line.size() + (atSpace ? 1 : 0));
  return line;
}

/// One row, over as many lines as its longest cell needs.
Array<String> linesOf(Array<String> cells, const Array<std::size_t>& widths) {
  Array<String> lines;
  do {
    String line;
    for (std::size_t i = 0; i < cells.size(); ++i) {
      String part = takeLine(cells[i], widths[i]);
      part.resize(widths[i], ' ');
      line.append(gap, ' ') += part;
    }
    // Trailing spaces would wrap on a terminal of just this width.
    line.erase(line.find_last_not_of(' ') + 1);
    lines.push_back(std::move(line));
  } while (!std::ranges::all_of(cells, &String::empty));
  return lines;
}

}  // namespace

Table::Table(Array<String> headings, std::size_t width, Bool emphasise)
    : rows_{std::move(headings)}, width_(width), emphasise_(emphasise) {}

void Table::add(Array<String> cells) {
  rows_.push_back(std::move(cells));
}

Array<std::size_t> Table::columnWidths() const {
  Array<std::size_t> widths(rows_.front().size());
  for (const Array<String>& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
  }
  const auto total = [&] {
    return std::accumulate(widths.begin(), widths.end(), widths.size() * gap);
  };
  // From the widest, so that short columns keep their words whole.
  while (total() > width_) {
    const auto widest = std::ranges::max_element(widths);
    if (*widest <= narrowestColumn) break;
    --*widest;
  }
  return widths;
}

String Table::text() const {
  const Array<std::size_t> widths = columnWidths();
  String all;
  for (const Array<String>& row : rows_) {
    // By its place: a row of cells may look like it.
    const Bool heading = &row == &rows_.front();
    for (const String& line : linesOf(row, widths)) {
      all += emphasised(line, heading && emphasise_) + '\n';
    }
  }
  return all;
}

String emphasised(const String& text, Bool emphasise) {
  return emphasise ? "\033[1m" + text + "\033[0m" : text;
}

}  // namespace Keelgate::CLI
