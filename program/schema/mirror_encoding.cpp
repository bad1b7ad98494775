// SPDX-License-Identifier: Apache-2.0
#include "program/schema/mirror_encoding.h"

namespace VespKeelgateService {

std::string uuidText(const Keelgate::UUID& uuid) {
  constexpr std::string_view digits = "0123456789ABCDEF";
  std::string text;
  for (std::size_t i = 0; i < uuid.octets.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += digits[uuid.octets[i] >> 4];
    text += digits[uuid.octets[i] & 15];
  }
  return text;
}

}  // namespace VespKeelgateService
