// SPDX-License-Identifier: Apache-2.0
/// A view of message bytes. Whoever makes one keeps the bytes alive and unchanged.
#pragma once

#include <cstddef>
#include <span>

namespace Keelgate::Text {}

namespace PropertyList {

using Bytes = std::span<const std::byte>;

/// Spellings that both sides of the seal share.
namespace Text = Keelgate::Text;

}  // namespace PropertyList
