// SPDX-License-Identifier: Apache-2.0
/// Many short messages on their way to one worker that is used again: both sides make a system call
/// for many of them.
///
/// It only ever gives good news. Where a worker ends, lies, or says nothing for long, each message
/// that has no reply yet is tried once more, alone in a fresh worker (Call), and what becomes of it
/// there is its outcome: so that one message never costs another, and each error is the right
/// one's.
#pragma once

#include "framework/client/call.h"

#include <list>
#include <memory>

namespace Keelgate {

/// A message in a queue, whatever record it asks for.
class Task {
 public:
  virtual ~Task() = default;
  /// Whether it may go together with others. Otherwise it is to be advanced.
  [[nodiscard]] virtual bool isShared() const noexcept = 0;
  /// Its request, with which it begins; null where there is none to be sent, and it goes alone.
  virtual const OutgoingMessage* request() noexcept = 0;
  /// It is at the head of those that share a worker: from now on its time counts.
  virtual void beginTime() noexcept = 0;
  /// Takes the reply to that. False: it is to go alone, because what came is not a good reply.
  virtual bool take(const ReceivedReply& reply) noexcept = 0;
  /// It is not shared any more.
  virtual void goAlone() noexcept = 0;
  /// As Call::advance; it begins when it is first called.
  virtual Optional<Wait> advance() noexcept = 0;
  /// Tells whoever asked for it. Nothing is done with it afterwards.
  virtual void complete() = 0;
  /// When advance() ends it even if it has not begun.
  [[nodiscard]] virtual Deadline deadline() const noexcept = 0;
};
/// A list, so that tasks change hands without an allocation.
using TaskList = std::list<std::unique_ptr<Task>>;

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
  /// Takes over the first task of a list, which is shared and has begun, while there is room.
  void add(TaskList& from) noexcept;

  /// Goes on as far as it can. What has its reply comes behind `done`, what is to go alone behind
  /// `alone`.
  void advance(TaskList& done, TaskList& alone) noexcept;
  /// What to wait for before it is advanced again; nothing when it has nothing to do.
  [[nodiscard]] const Optional<Wait>& wait() const noexcept { return wait_; }

 private:
  Optional<Wait> step(TaskList& done, TaskList& alone);
  Optional<Wait> acquire();
  Task& oldest() noexcept { return *(given_.empty() ? new_ : given_).front(); }
  void giveNew();
  Optional<Wait> exchange(TaskList& done, TaskList& alone);
  bool takeReply(TaskList& done);
  void fail(TaskList& alone) noexcept;
  void leave() noexcept;

  Pool& pool_;
  Optional<FairSemaphore::Permit> permit_;
  Optional<Worker> worker_;
  Optional<Exchange> exchange_;
  /// What the worker has been given and not answered, the oldest first; and what follows them.
  TaskList given_;
  TaskList new_;
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
