// SPDX-License-Identifier: Apache-2.0
/// One service, seen from its client: the launcher's pidfd and the control channel to the zygote,
/// which forks workers, kills them and tells how they ended.
///
/// Nothing here waits. Whoever needs news waits for waitForNews() and calls readNews(), which reads
/// for all.
#pragma once

#include "framework/client/launch.h"
#include "framework/protocol/frames.h"

#include <keelgate/client.h>
#include <keelgate/values.h>

#include <atomic>
#include <mutex>
#include <vector>

namespace Keelgate {

struct ServiceSettings {
  /// Where `socket` is empty the program at `path` is started.
  String path;
  String socket;
  /// Who else than root and the caller may serve on the socket.
  Optional<unsigned> socketUser;
  bool requireLayers;
  /// Every worker is forked; none is rewound.
  bool forks;
  std::uint64_t messagesPerWorker;
  std::uint64_t cpuSecondsPerWorker;
  /// How many workers may be alive at a time, those included that have answered and not yet ended.
  /// It bounds the processes that a client has on the machine.
  std::size_t maximumWorkers;
};

/// How long a service may take from its start until it is ready.
constexpr std::chrono::milliseconds startPatience{10'000};

/// All members may be called from any thread.
class ServiceProcess {
 public:
  /// It only ever moves on. A retired service finishes what it has and is given nothing more; a
  /// lost one has ended, or said what it should not have said.
  enum class State { starting, running, retired, lost };

  /// Starts it. Throws StartFailure.
  ServiceProcess(const ServiceSettings& settings, DescriptorRegistry& registry);
  ~ServiceProcess();
  ServiceProcess(const ServiceProcess&) = delete;
  ServiceProcess& operator=(const ServiceProcess&) = delete;

  [[nodiscard]] State state() const noexcept { return state_; }
  /// Why it never got ready. Nothing as long as it may, or when it did.
  [[nodiscard]] Optional<StartFailure> startFailure() const;

  /// A worker as its slot, with the client's end of its channel.
  struct Forked {
    std::uint32_t slot;
    Descriptor channel;
  };
  /// Asks for a worker for messages of at most so many bytes; nothing when the service is lost or
  /// has no slot or no room for the frame just now. Throws StartFailure when no channel can be
  /// made.
  Optional<Forked> fork(std::uint64_t longestMessage);

  /// How a worker ended.
  struct Exit {
    /// As waitpid gives it.
    int status;
    /// There was no process to be had for it, so it has read nothing.
    bool neverStarted;
  };
  /// How the worker ended, once it is known. The caller has not released it.
  [[nodiscard]] Optional<Exit> exitOf(std::uint32_t slot) const;

  /// Nobody will ask for this slot again: its worker has had its last message and ends by itself,
  /// or is killed.
  enum class Leaving { byItself, killed };
  void release(std::uint32_t slot, Leaving how) noexcept;

  /// Takes note of what the zygote has said, without waiting, and of workers that should have left.
  void readNews(Deadline now = Clock::now()) noexcept;
  /// What to wait for before readNews() is called again, `until` at the latest.
  [[nodiscard]] Wait waitForNews(Deadline until) const noexcept;

  /// It is given no further message. Workers are copies of one zygote and share its address layout:
  /// an attacker who could make one after the other fail could search for it.
  void retire() noexcept;

  /// Counts a reply that was one, and gives how many there were.
  std::uint64_t noteReply() noexcept { return ++replies_; }
  [[nodiscard]] std::uint64_t replies() const noexcept { return replies_; }
  [[nodiscard]] Deadline startedAt() const noexcept { return startedAt_; }

  /// How long each means of ending it is given before the next.
  struct Patience {
    /// For a zygote whose channel is closed, and its workers with it.
    std::chrono::milliseconds closed{100};
    /// For a launcher to kill its zygote and collect all that this leaves: time, on a crowded
    /// machine.
    std::chrono::milliseconds asked{300};
    /// For the kernel, after SIGKILL.
    std::chrono::milliseconds killed{100};
  };
  /// One step of its end, without waiting. Whether it has ended; otherwise to be called again when
  /// nextStep() is over. One thread at a time, which nobody else uses it beside.
  bool end(const Patience& patience) noexcept;
  [[nodiscard]] Wait nextStep() const noexcept;

  /// The layers that it has, as bits of Layer, and its version, as Protocol::versionText takes it.
  /// Of a service that is running.
  [[nodiscard]] std::uint64_t layers() const noexcept { return layers_; }
  [[nodiscard]] std::uint64_t version() const noexcept { return version_; }

 private:
  enum class SlotState {
    free,
    /// Somebody has the worker.
    held,
    /// It has ended, and whoever has it has not asked yet.
    ended,
    /// Released, to end by itself.
    leaving,
    /// The same since the last look at the slots.
    overdue,
    /// Released and killed.
    killed,
    /// The same since it stayed after its answer.
    stayed,
  };
  struct Slot {
    SlotState state = SlotState::free;
    Exit exit{};
  };
  enum class EndStep { none, closed, asked, killed };

  void noteFrame(const Protocol::ControlFrame& frame) noexcept;
  void noteAnswerToHello(const Protocol::ControlFrame& frame);
  void noteExit(Slot& slot, const Exit& exit) noexcept;
  void killAll(SlotState from, SlotState to) noexcept;
  bool sendKill(std::uint32_t slot) noexcept;
  void failToStart(StartFailure failure);
  void lose() noexcept;

  const ServiceSettings& settings_;
  DescriptorRegistry& registry_;
  /// Constant until its end.
  ServiceHandles handles_{};
  const Deadline startedAt_ = Clock::now();
  std::atomic<State> state_ = State::starting;
  std::atomic<std::uint64_t> replies_ = 0;
  /// Written before the state becomes `running`.
  std::uint64_t layers_ = 0;
  std::uint64_t version_ = 0;

  mutable std::mutex mutex_;
  Optional<StartFailure> startFailure_;
  /// Its size never changes.
  std::vector<Slot> slots_;
  Deadline lastLook_{};
  Deadline impatientUntil_{};

  EndStep endStep_ = EndStep::none;
  Deadline nextStepAt_{};
};

}  // namespace Keelgate
