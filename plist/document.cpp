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

void Value::find(const KnownKeys& keys, std::uint64_t* present, std::uint32_t* values) const {
  const Store& store = *store_;
  const std::uint32_t count = expect(Type::dictionary).count;
  const std::size_t size = store.referenceSize;
  const auto findBy = [&](auto positionOf) {
    const auto note = [&, known = keys.count, nodes = store.nodes.data() ](
        std::uint32_t key, auto value) __attribute__((always_inline)) {
      const std::size_t position = positionOf(nodes[key]);
      if (position >= known) return;
      present[position / 64] |= std::uint64_t{1} << position % 64;
      values[position] = value();
    };
    std::size_t place = store.firstChild(number_);
    if (size == 0) {
      for (std::uint32_t left = count; left > 0; --left, place = store.nextKey(place)) {
        const auto key = static_cast<std::uint32_t>(place);
        note(key, [&] { return key + 1; });
      }
      return;
    }
    const auto reference = [message = store.message, size](std::size_t position) {
      return static_cast<std::uint32_t>(Cursor::bigEndianAt(message, position, size));
    };
    const std::size_t apart = size * count;
    for (const std::size_t end = place + apart; place < end; place += size) {
      note(reference(place), [&] { return reference(place + apart); });
    }
  };
  // A key's number is its position, counted from 1, where the document was told of these keys.
  if (store.known == &keys) {
    findBy([](const Node& key) { return std::size_t{key.key()} - 1; });
  } else {
    findBy([&](const Node& key) {
      return keys.find(store.digest(key.key()), [&] { return store.text(key); });
    });
  }
}

/// The first bytes decide; a binary one of another version is refused there, never tried as XML.
Document::Document(Bytes message, const KnownKeys& known) {
  if (message.size() > Limits::length) throw MalformedDocument(Problem::messageTooLarge, 0);
  store_.message = message;
  store_.known = &known;
  const std::string_view beginning = Cursor(message).rest();
  refuseOtherFormats(beginning);
  if (beginning.starts_with("bplist")) {
    readBinary(store_);
  } else {
    readXml(store_);
  }
}

}  // namespace PropertyList
