// SPDX-License-Identifier: Apache-2.0
/// What XML 1.0 calls Char, NameStartChar and NameChar. They say what may stand in a document, not
/// what is sensible to show.
///
/// Pure functions; may be used from any thread.
#pragma once

namespace PropertyList {

bool isXmlCharacter(char32_t codePoint) noexcept;
bool isXmlNameStart(char32_t codePoint) noexcept;
bool isXmlNameCharacter(char32_t codePoint) noexcept;

}  // namespace PropertyList
