// SPDX-License-Identifier: Apache-2.0
// A view of message bytes. Whoever makes one keeps the bytes alive and unchanged.
#pragma once

#include <cstddef>
#include <span>

namespace Keelgate::Text {}

namespace PropertyList {

namespace Text = Keelgate::Text;

using Bytes = std::span<const std::byte>;

}  // namespace PropertyList
