// SPDX-License-Identifier: Apache-2.0
/// Fills schemas and records by walking their fields.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/enumeration.h>

#include <limits>
#include <string>
#include <utility>
#include <variant>

namespace Keelgate::Testing {

/// Gives every value a different one, as far as its type has so many. Dates are whole seconds, or
/// the last that is finite: with one bit changed it is not.
class Filler {
 public:
  /// Lists have so many elements, and none where they are that deep in others. Another start gives
  /// other values, and other cases where there is a choice.
  explicit Filler(int elements = 2, int depth = 2, int start = 100, bool lastDate = false)
      : elements_(elements), depth_(depth), last_(start), lastDate_(lastDate) {}

  template <class T>
  void fill(T& value, int depth = 0) {
    const int n = ++last_;
    if constexpr (isOptional<T>) {
      fill(value.emplace(), depth);
    } else if constexpr (isArray<T>) {
      if (depth < depth_) value.resize(static_cast<std::size_t>(elements_));
      for (auto& element : value) fill(element, depth + 1);
    } else if constexpr (CaseKeyed<T>) {
      constexpr std::size_t cases = std::variant_size_v<typename T::variant>;
      [&]<std::size_t... i>(std::index_sequence<i...>) {
        const auto which = static_cast<std::size_t>(n) % cases;
        ((which == i ? fill(value.template emplace<i>(), depth) : void()), ...);
      }
      (std::make_index_sequence<cases>());
    } else if constexpr (Described<T>) {
      FieldsOf<T>::each([&](auto field) { fill(value.*field.member, depth); });
    } else if constexpr (std::same_as<T, String>) {
      value = "t\u00e9xt " + std::to_string(n);
    } else if constexpr (std::same_as<T, Data>) {
      const std::string text = "octets " + std::to_string(n);
      const auto bytes = std::as_bytes(std::span(text));
      value.assign(bytes.begin(), bytes.end());
    } else if constexpr (std::same_as<T, Date>) {
      value.secondsSinceReferenceDate = lastDate_ ? std::numeric_limits<double>::max() : n;
    } else if constexpr (std::same_as<T, UUID>) {
      value.octets[3] = static_cast<std::uint8_t>(n >> 8);
      value.octets[15] = static_cast<std::uint8_t>(n);
    } else if constexpr (std::same_as<T, Bool>) {
      value = n % 2 == 0;
    } else if constexpr (Enumeration<T>) {
      value = static_cast<T>(casesOf<T>.back().rawValue);
    } else if constexpr (std::same_as<T, Double>) {
      value = n + 0.25;
    } else if constexpr (!std::same_as<T, std::nullptr_t>) {
      value = static_cast<T>(n);
    }
  }

 private:
  int elements_;
  int depth_;
  int last_;
  bool lastDate_;
};

}  // namespace Keelgate::Testing
