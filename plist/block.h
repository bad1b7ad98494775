// SPDX-License-Identifier: Apache-2.0
// Sixteen bytes at a time, in the compilers' portable vectors: one register where the machine has
// such, words elsewhere.
//
// Pure functions; may be used from any thread.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

namespace PropertyList {

inline constexpr std::size_t blockLength = 16;
// Signed, because that is what machines compare: the bytes above 0x7F are below zero.
using Block [[gnu::vector_size(blockLength)]] = signed char;

// How many bytes come before the first that a comparison marked; blockLength if it marked none.
inline std::size_t unmarkedPrefix(Block marks) noexcept {
#ifdef __SSE2__
  using Mask [[gnu::vector_size(blockLength)]] = char;
  const auto bits = static_cast<unsigned>(__builtin_ia32_pmovmskb128(std::bit_cast<Mask>(marks)));
  return static_cast<std::size_t>(std::countr_zero(bits | 1U << blockLength));
#else
  constexpr bool isLittle = std::endian::native == std::endian::little;
  const auto before = [](std::uint64_t word) {
    return static_cast<std::size_t>(isLittle ? std::countr_zero(word) : std::countl_zero(word)) / 8;
  };
  const auto words = std::bit_cast<std::array<std::uint64_t, 2>>(marks);
  return words[0] != 0 ? before(words[0]) : 8 + before(words[1]);
#endif
}

}  // namespace PropertyList
