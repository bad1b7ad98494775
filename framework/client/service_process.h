// SPDX-License-Identifier: Apache-2.0
/// One running service, seen from its client: the launcher's pidfd and the control channel to the
/// zygote, which forks workers, kills them and tells how they ended.
///
/// There is no thread that reads the channel. Whoever needs news reads it for all: one waiting
/// thread at a time polls, the others sleep until it tells them.
#pragma once

#include "framework/client/launch.h"
#include "framework/protocol/frames.h"

#include <keelgate/client.h>
#include <keelgate/values.h>

#include <atomic>
#include <condition_variable>
#include <mutex>

namespace Keelgate {

/// A zygote that is well has taken a frame within this.
constexpr std::chrono::milliseconds killPatience{100};

struct ServiceSettings {
  /// Where `socket` is empty the program at `path` is started.
  String path;
  String socket;
  bool requireLayers;
  std::uint64_t messagesPerWorker;
  std::uint64_t cpuSecondsPerWorker;
  /// How many workers may be alive at a time, those included that have answered and not yet ended.
  /// It bounds the processes that a client has on the machine.
  std::size_t maximumWorkers;
};

/// All members may be called from any thread.
class ServiceProcess {
 public:
  /// Starts the service and shakes hands. Throws StartFailure.
  ServiceProcess(const ServiceSettings& settings, DescriptorBook& book, Deadline deadline);
  /// Ends it at once, if end() was not called.
  ~ServiceProcess();
  ServiceProcess(const ServiceProcess&) = delete;
  ServiceProcess& operator=(const ServiceProcess&) = delete;

  /// A worker as its slot, with the client's end of its channel.
  struct Forked {
    std::uint32_t slot;
    Descriptor channel;
    /// Bytes of heap that it was given.
    std::size_t heap;
  };
  /// Asks for a worker for messages of at most so many bytes, without waiting for it; nothing when
  /// the service is lost or all slots are taken until the deadline. Throws StartFailure when no
  /// channel can be made.
  Optional<Forked> fork(std::uint64_t longestMessage, Deadline deadline);
  /// SIGKILL for the worker, if it still runs.
  void kill(std::uint32_t slot) noexcept;
  /// Whether the zygote says in time that it has killed the worker, or that the worker has ended.
  /// The end itself may take longer: the kernel takes back what memory it had, gigabytes perhaps.
  bool awaitKill(std::uint32_t slot, Deadline deadline);
  /// How a worker ended.
  struct Exit {
    /// As waitpid gives it.
    int status;
    /// There was no process to be had for it, so it has read nothing.
    bool neverStarted;
  };
  /// How the worker ended; nothing when the service is lost or it takes too long.
  /// The caller has had a worker on the slot and has not released it.
  Optional<Exit> awaitExit(std::uint32_t slot, Deadline deadline);
  /// Nobody will ask for this slot again.
  void release(std::uint32_t slot) noexcept;
  /// Takes note of the workers that have ended, without waiting.
  void collect() noexcept;

  /// Whether it should still be given messages: it is neither lost, nor did a worker of it die of a
  /// signal. Workers are copies of one zygote and share its address layout: an attacker who could
  /// crash one after the other could search for it.
  [[nodiscard]] bool isUsable() const noexcept { return state_ == State::running; }
  [[nodiscard]] bool isLost() const noexcept { return state_ == State::lost; }

  /// SIGKILL for all of it. For a service that does not do what it is told. Whoever waits for news
  /// of it is woken.
  void destroy() noexcept;
  /// Closes the channel, waits for the end so long, and then uses SIGKILL.
  void end(std::chrono::milliseconds patience) noexcept;

  /// The walls that it has, as bits of Layer.
  [[nodiscard]] std::uint64_t layers() const noexcept { return layers_; }
  /// Its version, as Transport::packVersion has it.
  [[nodiscard]] std::uint64_t version() const noexcept { return version_; }

 private:
  /// It only ever moves to the right. A retired service finishes what it has.
  enum class State { running, retired, lost };
  struct Slot {
    /// `released`: nobody asks any more, and it has not ended; `ended`: the other way round. Only
    /// when both have happened is the slot free, so that no exit can be taken for another worker's.
    enum class Phase { free, running, released, ended };
    Phase phase = Phase::free;
    /// By us: then a death by SIGKILL says nothing of the message.
    bool killed = false;
    /// The zygote has said that it did.
    bool confirmed = false;
    /// When it was released, or was killed after that.
    Deadline since{};
    Exit exit{};
  };
  using Lock = std::unique_lock<std::mutex>;

  void shakeHands(const ServiceSettings& settings, Deadline deadline);
  [[noreturn]] static void failToStart(bool late);
  Optional<std::uint32_t> claimSlot(Deadline deadline);
  void killSlot(std::uint32_t slot) noexcept;
  /// Until the condition holds, the service is lost or the deadline has passed; the lock is given
  /// up meanwhile.
  template <class Condition>
  void readUntil(Lock& lock, Deadline deadline, Condition condition);
  void readAll() noexcept;
  void note(const Protocol::ControlFrame& frame) noexcept;
  void noteExit(Slot& slot, const Protocol::ControlFrame& frame) noexcept;
  void lose() noexcept;

  DescriptorBook& book_;
  /// Constant between construction and end().
  ServiceHandles handles_{};
  std::uint64_t layers_ = 0;
  std::uint64_t version_ = 0;
  std::atomic<State> state_ = State::running;

  std::mutex mutex_;
  /// Somebody has read the channel, or stopped reading it.
  std::condition_variable news_;
  /// Whether a thread polls the channel for all.
  bool reading_ = false;
  /// Its size never changes.
  std::vector<Slot> slots_;
};

}  // namespace Keelgate
