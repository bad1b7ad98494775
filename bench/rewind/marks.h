// SPDX-License-Identifier: Apache-2.0
/// Stands for a parser that was taken over, and tries to leave something for the next message.
#pragma once

#include <keelgate/values.h>

#include <span>
#include <string_view>

namespace Keelgate::Rewind {

struct Mark {
  std::string_view name;
  void (*leave)();
  /// Whether its worker cannot be set back: it has ended, or is to be thrown away.
  bool ends;
};

/// Each is left in a sealed worker, in the middle of its message. Most end the worker at once, as
/// code would that does not want its marks to be written over.
std::span<const Mark> marks() noexcept;

}  // namespace Keelgate::Rewind
