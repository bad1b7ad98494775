// SPDX-License-Identifier: Apache-2.0
#include "framework/contracts/layers.h"

#include <span>

namespace Keelgate {

std::string missingLayersLine(std::uint64_t layers) {
  std::string line;
  for (const NamedLayer& row :
       std::span(namedLayers).subspan(requiredLayerCount, optionalLayerCount)) {
    if ((layers & row.layer) != 0) continue;
    line += line.empty() ? "Running without: " : ", ";
    line += row.name;
  }
  return line;
}

}  // namespace Keelgate
