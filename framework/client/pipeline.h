// SPDX-License-Identifier: Apache-2.0
/// Many short messages on their way to one worker that is used again: both sides make a system call
/// for many of them.
///
/// It only ever gives good news. Where a worker ends, violates the protocol, or says nothing for
/// long, each message that has no reply yet is tried once more, alone in a fresh worker (Call), and
/// what becomes of it there is its outcome: so that one message never costs another, and each error
/// is the right one's.
#pragma once

#include "framework/client/call.h"

namespace Keelgate {

/// One thread at a time.
class Pipeline {
 public:
  explicit Pipeline(Pool& pool) noexcept : pool_(pool) {}

  /// So many messages, and so many bytes of them, are on their way at a time.
  static constexpr std::size_t capacity = 128;
  static constexpr std::size_t capacityBytes = std::size_t{128} << 10;
  /// The longest message in bytes that goes together with others: what is longer takes so long that
  /// a call of its own does not matter.
  static constexpr std::size_t longest = std::size_t{16} << 10;

  [[nodiscard]] bool hasRoom() const noexcept { return count() < depth_ && bytes_ < capacityBytes; }
  [[nodiscard]] std::size_t count() const noexcept { return given_.size() + new_.size(); }
  /// Takes over the first call of a list, which may be shared and sent, while there is room.
  void add(CallList& from) noexcept;

  /// Goes on as far as it can. What has its reply comes behind `done`, what is to go alone behind
  /// `alone`.
  void advance(CallList& done, CallList& alone) noexcept;
  /// What to wait for before it is advanced again; nothing when it has nothing to do.
  [[nodiscard]] const Optional<Wait>& wait() const noexcept { return wait_; }

 private:
  Optional<Wait> step(CallList& done, CallList& alone);
  Optional<Wait> acquire();
  Call& oldest() noexcept { return (given_.empty() ? new_ : given_).front(); }
  void giveNew();
  Optional<Wait> exchange(CallList& done, CallList& alone);
  bool takeReply(CallList& done);
  void fail(CallList& alone) noexcept;
  void leave() noexcept;

  Pool& pool_;
  Optional<FairSemaphore::Permit> permit_;
  Optional<Worker> worker_;
  Optional<Exchange> exchange_;
  /// What the worker has been given and not answered, the oldest first; and what follows them.
  CallList given_;
  CallList new_;
  std::size_t bytes_ = 0;
  /// How many more the worker is given before its permit is somebody else's.
  std::size_t turn_ = 0;
  /// How many may be on their way just now.
  std::size_t depth_ = 1;
  /// When the worker last gave a reply, or was given something to do.
  Deadline lastSign_{};
  Optional<Wait> wait_;
};

}  // namespace Keelgate
