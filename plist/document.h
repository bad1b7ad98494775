// SPDX-License-Identifier: Apache-2.0
// A checked property list, binary or XML, and cheap handles to what is in it.
//
//   PropertyList::Document document(message);       // throws Damage
//   for (auto [key, value] : document.top().entries()) { ... }
//
// The constructor checks everything that the top object reaches, so that no accessor can meet
// damage later. It takes time and memory in proportion to the message's length, whatever is in it.
//
// Ownership: a Document keeps views into the message; Values, and the strings and data that they
// give, point into both. All are good while the message and the Document live.
// Threads: after construction everything is read-only and may be used from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

#include "plist/bytes.h"
#include "plist/damage.h"
#include "plist/store.h"

namespace PropertyList {

// All integers from -2^63 to 2^64 - 1: two's complement bits, and how to read them. No single
// built-in type holds both ends, so the range is checked by whoever has a field to fill.
struct Integer {
  std::uint64_t bits;
  bool negative;

  bool operator==(const Integer&) const = default;
};

class ArrayRange;
class EntryRange;

// A handle to one object; copied freely. Asking for another type than type() is the caller's
// defect and throws std::logic_error.
class Value {
 public:
  // Of every value, null included.
  Type type() const noexcept { return node().type; }
  // Each throws std::logic_error for a value of another type, and nothing else. They cost a
  // look-up; none allocates or converts.
  bool boolean() const { return expect(Type::boolean).bits != 0; }
  Integer integer() const;
  double real() const;
  double date() const;              // seconds since 2001-01-01T00:00:00Z, finite
  std::string_view string() const;  // valid UTF-8
  Bytes data() const;
  std::size_t count() const;    // elements of an array or set, entries of a dictionary
  ArrayRange elements() const;  // of an array or set, in order
  EntryRange entries() const;   // of a dictionary, in order

  // A value of this container as a bare number, and back: for who keeps many of them. Only a number
  // that this container gave may come back.
  std::uint32_t number() const noexcept { return number_; }
  Value child(std::uint32_t number) const noexcept { return {*store_, number, shared_}; }

  // Whether this object, or any container on the way to it, is referenced more than once, so that
  // it may be reached more often than its bytes can justify. Never in XML.
  bool isShared() const noexcept { return shared_; }

 private:
  friend class Document;
  friend class ArrayRange;
  friend class EntryRange;

  Value(const Store& store, std::uint32_t number, bool shared) noexcept
      : store_(&store), number_(number), shared_(shared || node().has(Node::shared)) {}

  const Node& node() const noexcept { return store_->nodes[number_]; }
  const Node& expect(Type type) const {
    if (node().type != type) refuse();
    return node();
  }
  // Apart, so that the accessors stay small enough to be inlined.
  [[noreturn]] static void refuse();

  const Store* store_;
  std::uint32_t number_;
  bool shared_;
};

// What a dictionary holds under one key. The key is valid UTF-8.
struct Entry {
  std::string_view key;
  Value value;
};

// The elements of an array or set, to be walked with `for`. Walked once and forwards; an iterator
// at the end may not be read or moved. Nothing is copied: the elements of a shared array cost
// nothing until somebody makes something of them.
class ArrayRange {
 public:
  class Iterator {
   public:
    using value_type = Value;
    using difference_type = std::ptrdiff_t;

    Value operator*() const noexcept { return {*store_, store_->child(position_), shared_}; }
    Iterator& operator++() noexcept {
      position_ = store_->after(position_);
      --remaining_;
      return *this;
    }
    void operator++(int) noexcept { ++*this; }
    bool operator==(std::default_sentinel_t) const noexcept { return remaining_ == 0; }

   private:
    friend class ArrayRange;
    Iterator(const Store& store, std::size_t position, std::uint32_t count, bool shared) noexcept
        : store_(&store), position_(position), remaining_(count), shared_(shared) {}

    const Store* store_;
    std::size_t position_;
    std::uint32_t remaining_;
    bool shared_;
  };

  // Single pass would do for every reader; a copy of an iterator may be walked again all the same.
  Iterator begin() const noexcept { return first_; }
  std::default_sentinel_t end() const noexcept { return {}; }

 private:
  friend class Value;
  ArrayRange(const Store& store, std::size_t position, std::uint32_t count, bool shared) noexcept
      : first_(store, position, count, shared) {}

  Iterator first_;
};

// The entries of a dictionary, to be walked with `for`. Every key occurs once: that was checked.
class EntryRange {
 public:
  class Iterator {
   public:
    using value_type = Entry;
    using difference_type = std::ptrdiff_t;

    Entry operator*() const noexcept {
      return {store_->text(store_->nodes[store_->child(key_)]),
              {*store_, store_->child(value_), shared_}};
    }
    Iterator& operator++() noexcept {
      // Binary keeps all keys before all values; XML has them in turn.
      if (store_->referenceSize != 0) {
        key_ += store_->referenceSize;
        value_ += store_->referenceSize;
      } else {
        key_ = store_->after(value_);
        value_ = key_ + 1;
      }
      --remaining_;
      return *this;
    }
    void operator++(int) noexcept { ++*this; }
    bool operator==(std::default_sentinel_t) const noexcept { return remaining_ == 0; }

   private:
    friend class EntryRange;
    Iterator(const Store& store, std::size_t key, std::size_t value, std::uint32_t count,
             bool shared) noexcept
        : store_(&store), key_(key), value_(value), remaining_(count), shared_(shared) {}

    const Store* store_;
    // Positions as the store counts them. The two move in step.
    std::size_t key_;
    std::size_t value_;
    std::uint32_t remaining_;
    bool shared_;
  };

  Iterator begin() const noexcept { return first_; }
  std::default_sentinel_t end() const noexcept { return {}; }

 private:
  friend class Value;
  EntryRange(const Store& store, std::size_t key, std::size_t value, std::uint32_t count,
             bool shared) noexcept
      : first_(store, key, value, count, shared) {}

  Iterator first_;
};

class Document {
 public:
  // Throws Damage for anything that is no property list, and std::bad_alloc. A small message costs
  // no allocation, a larger one a few: never one per object. The message must not change while the
  // Document lives: what was checked is not checked again.
  explicit Document(Bytes message);

  // Values point at the document, so it stays where it is.
  Document(const Document&) = delete;
  Document& operator=(const Document&) = delete;

  // Of any type: that it must be a dictionary is for whoever has a schema.
  Value top() const noexcept { return {store_, store_.top, false}; }

 private:
  Store store_;
};

}  // namespace PropertyList
