// SPDX-License-Identifier: Apache-2.0
/// The name of a type as its source spells it, without its namespace or enclosing class, so that
/// no table has to repeat it as a string.
///
/// Evaluated at compile time; callable from any thread. The texts live as long as the program.
#pragma once

#include <cstddef>
#include <string_view>

namespace Keelgate {

namespace Detail {

// The compilers have no other spelling of a type at compile time: typeid's name is mangled, and not
// a constant.
template <class T>
constexpr std::string_view prettyFunction() {
  return __PRETTY_FUNCTION__;
}

// Where the name stands in the compiler's text is learnt from a type whose name is known.
constexpr std::string_view probe = prettyFunction<double>();
constexpr std::size_t prefix = probe.find("double");
constexpr std::size_t suffix = probe.size() - prefix - std::string_view("double").size();

}  // namespace Detail

/// For a type that is not a template, e.g. "VespSessionInvitation".
template <class T>
constexpr std::string_view typeName() {
  constexpr std::string_view text = Detail::prettyFunction<T>();
  constexpr std::string_view qualified =
      text.substr(Detail::prefix, text.size() - Detail::prefix - Detail::suffix);
  constexpr std::size_t colon = qualified.rfind(':');
  return colon == std::string_view::npos ? qualified : qualified.substr(colon + 1);
}

}  // namespace Keelgate
