// SPDX-License-Identifier: Apache-2.0
/// Where in the message a decoder is: one node on the stack for each step, linked to the step
/// outside it, so that a path costs nothing until an error needs it.
#pragma once

#include <keelgate/errors.h>

#include <algorithm>
#include <string_view>

namespace VespKeelgateService {

/// A node lives on the stack of the decoder that made it and must not outlive the outer one, nor
/// the key, which is a schema's or the message's. One thread.
class CodingPath {
 public:
  /// The whole message: an empty path.
  CodingPath() = default;
  CodingPath(const CodingPath& outer, std::string_view key) : outer_(&outer), key_(key) {}
  CodingPath(const CodingPath& outer, std::size_t index)
      : outer_(&outer), index_(index), isIndex_(true) {}

  // A node is linked to by its address.
  CodingPath(const CodingPath&) = delete;
  CodingPath& operator=(const CodingPath&) = delete;

  /// The whole path, outermost step first.
  [[nodiscard]] Keelgate::Array<Keelgate::CodingKey> steps() const {
    Keelgate::Array<Keelgate::CodingKey> steps;
    for (const CodingPath* at = this; at->outer_ != nullptr; at = at->outer_) {
      if (at->isIndex_) {
        steps.emplace_back(at->index_);
      } else {
        steps.emplace_back(Keelgate::String(at->key_));
      }
    }
    std::reverse(steps.begin(), steps.end());
    return steps;
  }

 private:
  /// Null for the whole message alone.
  const CodingPath* outer_ = nullptr;
  std::string_view key_;
  std::size_t index_ = 0;
  bool isIndex_ = false;
};

}  // namespace VespKeelgateService
