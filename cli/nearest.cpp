// SPDX-License-Identifier: Apache-2.0
#include "cli/nearest.h"

#include <fmt/format.h>

#include <algorithm>
#include <numeric>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// More would be a list to search.
constexpr std::size_t most = 3;

/// How many characters must change between two names. One row of the usual table at a time, since
/// names are short and many.
std::size_t distance(std::string_view one, std::string_view other) {
  Array<std::size_t> row(other.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < one.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < other.size(); ++j) {
      const std::size_t changed = diagonal + (one[i] == other[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({changed, row[j] + 1, row[j + 1] + 1});
    }
  }
  return row.back();
}

}  // namespace

String suggestion(Array<std::string_view> names, std::string_view name,
                  std::string_view otherwise) {
  // A third of the name may be mistyped; a part of a name is like it too.
  const auto unlike = [&](std::string_view candidate) {
    const Bool part = name.size() > 2 && candidate.find(name) != std::string_view::npos;
    return part ? 0 : distance(name, candidate);
  };
  std::erase_if(names, [&](std::string_view n) { return unlike(n) > (name.size() + 2) / 3; });
  std::ranges::stable_sort(names, {}, unlike);
  if (names.size() > most) names.resize(most);
  if (names.empty()) return String(otherwise);
  return fmt::format("did you mean {}?", fmt::join(names, " or "));
}

}  // namespace Keelgate::CLI
