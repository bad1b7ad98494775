// SPDX-License-Identifier: Apache-2.0
/// The accessors: each checks the type, then looks at the node. Everything else was checked before.
#include "plist/document.h"

#include "plist/limits.h"

#include <stdexcept>

namespace PropertyList {
namespace {

/// What people send in place of a property list, told apart so that they see why it is refused.
void refuseOtherFormats(std::string_view message) {
  struct Format {
    std::string_view beginning;
    Problem problem;
  };
  static constexpr Format formats[] = {
      {"\x1f\x8b", Problem::compressed}, {"\xfe\xff", Problem::utf16}, {"\xff\xfe", Problem::utf16},
      {{"\0<", 2}, Problem::utf16},      {{"<\0", 2}, Problem::utf16},
  };
  if (message.empty()) throw MalformedDocument(Problem::empty, 0);
  for (const Format& format : formats) {
    if (message.starts_with(format.beginning)) throw MalformedDocument(format.problem, 0);
  }
}

}  // namespace

/// A logic error and not MalformedDocument: no message can bring it about, only a defect of its
/// reader.
void Value::refuse() {
  throw std::logic_error("A property-list value was asked for another type");
}

std::size_t Value::count() const {
  if (!isContainer(type())) refuse();
  return node().count;
}

std::size_t Value::position() const noexcept {
  const bool isBytes = type() == Type::string || type() == Type::data;
  const bool isReferences = isContainer(type()) && store_->referenceSize != 0;
  return (isBytes && !node().has(Node::inSide)) || isReferences ? node().position() : 0;
}

ArrayRange Value::elements() const {
  // A set has an order here: that of the message.
  if (type() != Type::array && type() != Type::set) refuse();
  return {*store_, 0, store_->firstChild(number_), node().count, isShared()};
}

EntryRange Value::entries() const {
  const std::uint32_t count = expect(Type::dictionary).count;
  const std::size_t key = store_->firstChild(number_);
  // From a key to its value: in binary all keys come first.
  const std::size_t apart = store_->referenceSize == 0 ? 1 : store_->referenceSize * count;
  return {*store_, key, key + apart, count, isShared()};
}

/// The first bytes decide; a binary one of another version is refused there, never tried as XML.
Document::Document(Bytes message) {
  if (message.size() > Limits::length) throw MalformedDocument(Problem::messageTooLarge, 0);
  store_.message = message;
  const std::string_view beginning = Cursor(message).rest();
  refuseOtherFormats(beginning);
  if (beginning.starts_with("bplist")) {
    readBinary(store_);
  } else {
    readXml(store_);
  }
}

}  // namespace PropertyList
