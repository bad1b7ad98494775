// SPDX-License-Identifier: Apache-2.0
// The door for XML property lists.
#include <string_view>

#include "fuzz/plist_twins.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  if (text.starts_with("bplist")) return 0;
  PropertyList::checkTwins(std::as_bytes(std::span(data, size)));
  return 0;
}
