// SPDX-License-Identifier: Apache-2.0
#include "framework/transport/wire.h"

#include "text/utf8.h"

namespace Keelgate::Transport {

std::string_view Reader::text() {
  const Bytes bytes = octets();
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  if (!Text::isUtf8(text)) throw MalformedReply();
  return text;
}

}  // namespace Keelgate::Transport
