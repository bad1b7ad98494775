// SPDX-License-Identifier: Apache-2.0
/// A checked property list, binary or XML, and cheap handles to what is in it.
///
///   PropertyList::Document document(message);       // throws MalformedDocument
///   for (auto [key, value] : document.top().entries()) { ... }
///
/// The constructor checks everything that the top object reaches, so that no accessor can meet
/// anything malformed later. It takes time and memory in proportion to the message's length,
/// whatever is in it.
///
/// Ownership: a Document keeps views into the message; Values, and the strings and data that they
/// give, point into both. All are good while the message and the Document live.
/// Threads: after construction everything is read-only and may be used from any thread.
#pragma once

#include "plist/bytes.h"
#include "plist/known_keys.h"
#include "plist/malformed_document.h"
#include "plist/store.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <span>
#include <string_view>
#include <type_traits>

namespace PropertyList {

/// All integers from -2^63 to 2^64 - 1: two's complement bits, and how to read them. No single
/// built-in type holds both ends, so the range is checked by whoever has a field to fill.
struct Integer {
  std::uint64_t bits;
  bool negative;

  bool operator==(const Integer&) const = default;
};

template <typename Item>
class Range;
class Value;
struct Entry;
using ArrayRange = Range<Value>;
using EntryRange = Range<Entry>;

/// A handle to one object; copied freely. Asking for another type than type() is the caller's
/// defect and throws std::logic_error.
class Value {
 public:
  /// Of every value, null included.
  Type type() const noexcept { return node().type; }
  /// Each throws std::logic_error for a value of another type, and nothing else. They cost a
  /// look-up; none allocates or converts.
  bool boolean() const { return expect(Type::boolean).bits != 0; }
  Integer integer() const {
    const Node& node = expect(Type::integer);
    if (node.count == 0) return {node.bits, node.has(Node::negative)};
    const std::uint64_t bits = store_->number(node);
    // The narrow ones have no sign.
    return {bits, node.count == 8 && bits >> 63 != 0};
  }
  double real() const {
    const Node& node = expect(Type::real);
    return std::bit_cast<double>(node.count == 0 ? node.bits : store_->number(node));
  }
  // Seconds since 2001-01-01T00:00:00Z, finite.
  double date() const { return std::bit_cast<double>(expect(Type::date).bits); }
  // Valid UTF-8.
  std::string_view string() const { return store_->text(expect(Type::string)); }
  Bytes data() const { return bytes(Type::data); }
  // A number of 1 to 16 bytes, most significant first.
  Bytes uid() const { return bytes(Type::uid); }
  std::size_t count() const;    // elements of an array or set, entries of a dictionary
  ArrayRange elements() const;  // of an array or set, in order
  EntryRange entries() const;   // of a dictionary, in order

  /// A value of this container as a bare number, and back: for who keeps many of them. Only a
  /// number that this container gave may come back.
  std::uint32_t number() const noexcept { return number_; }
  Value child(std::uint32_t number) const noexcept { return {*store_, number, isShared()}; }

  /// The entries of a dictionary whose keys are among these: for each, by the position of its key,
  /// a bit in `present`, which is zero before, and the number of its value in `values`. Fastest for
  /// the keys that the Document was told of.
  void find(const KnownKeys& keys, std::uint64_t* present, std::uint32_t* values) const;

  /// Whether this object, or any container on the way to it, is referenced more than once, so that
  /// it may be reached more often than its bytes can justify. Never in XML.
  bool isShared() const noexcept { return isShared_; }
  /// Where its content stands in the message, in bytes from 0; 0 where the node does not tell.
  std::size_t position() const noexcept;

 private:
  friend class Document;
  friend class Range<Value>;
  friend class Range<Entry>;

  Value(const Store& store, std::uint32_t number, bool isInShared) noexcept
      : store_(&store),
        number_(number),
        isShared_(isInShared || store.nodes[number].has(Node::shared)) {}

  const Node& node() const noexcept { return store_->nodes[number_]; }
  const Node& expect(Type type) const {
    if (node().type != type) refuse();
    return node();
  }
  Bytes bytes(Type type) const { return std::as_bytes(std::span(store_->text(expect(type)))); }
  /// Apart, so that the accessors stay small enough to be inlined.
  [[noreturn]] static void refuse();

  const Store* store_;
  std::uint32_t number_;
  /// Looked up once, since each child asks.
  bool isShared_;
};

/// What a dictionary holds under one key. Every key occurs once: that was checked.
struct Entry {
  std::string_view key;  // valid UTF-8
  Value value;
};

/// The elements of an array or set, or the entries of a dictionary, to be walked with `for`. Walked
/// forwards; an iterator at the end may not be read or moved. Nothing is copied: the elements of a
/// shared array cost nothing until somebody makes something of them.
template <typename Item>
class Range {
 public:
  class Iterator {
   public:
    using value_type = Item;
    using difference_type = std::ptrdiff_t;

    Item operator*() const noexcept {
      const Value value(*store_, store_->child(value_), shared_);
      if constexpr (isEntry) {
        return {store_->text(store_->nodes[store_->child(key_)]), value};
      } else {
        return value;
      }
    }
    Iterator& operator++() noexcept {
      if constexpr (isEntry) {
        // The two move in step, whichever way the format keeps them.
        const std::size_t apart = value_ - key_;
        key_ = store_->nextKey(key_);
        value_ = key_ + apart;
      } else {
        value_ = store_->after(value_);
      }
      --remaining_;
      return *this;
    }
    void operator++(int) noexcept { ++*this; }
    bool operator==(std::default_sentinel_t) const noexcept { return remaining_ == 0; }

   private:
    friend class Range;
    static constexpr bool isEntry = std::is_same_v<Item, Entry>;

    Iterator(const Store& store, std::size_t key, std::size_t value, std::uint32_t count,
             bool shared) noexcept
        : store_(&store), key_(key), value_(value), remaining_(count), shared_(shared) {}

    const Store* store_;
    /// Positions as the store counts them.
    std::size_t key_;
    std::size_t value_;
    std::uint32_t remaining_;
    bool shared_;
  };

  Iterator begin() const noexcept { return first_; }
  std::default_sentinel_t end() const noexcept { return {}; }

 private:
  friend class Value;
  Range(const Store& store, std::size_t key, std::size_t value, std::uint32_t count,
        bool shared) noexcept
      : first_(store, key, value, count, shared) {}

  Iterator first_;
};

class Document {
 public:
  /// Throws MalformedDocument for anything that is not a property list, and std::bad_alloc. A small
  /// message costs no allocation, a larger one a few: never one per object. The message must not
  /// change while the Document lives: what was checked is not checked again.
  ///
  /// The keys that are known make no difference but in time, and have to outlive the Document.
  explicit Document(Bytes message, const KnownKeys& known = noKnownKeys);

  /// Values point at the document, so it stays where it is.
  Document(const Document&) = delete;
  Document& operator=(const Document&) = delete;

  /// Of any type: that it must be a dictionary is for whoever has a schema.
  Value top() const noexcept { return {store_, store_.top, false}; }

 private:
  Store store_;
};

}  // namespace PropertyList
