// SPDX-License-Identifier: Apache-2.0
/// What became of a worker, as the reasons that the application is given.
#include "framework/client/worker.h"

#include "framework/contracts/start_step.h"

#include <sys/wait.h>

#include <csignal>
#include <cstring>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;

namespace {

/// The zygote tells of a death at once; on a machine that swaps, somewhat later.
constexpr milliseconds exitPatience{500};

/// An exit status is the worker's own word, and one that was taken over may choose it: what it can
/// claim so is one of the host's errors, for the message that it was sent.
HostError explain(const ServiceProcess::Exit& exit) {
  if (exit.neverStarted) {
    return {Reason::startFailed, startFailureSentence(StartStep::startProcesses, 0)};
  }
  const int status = exit.status;
  if (WIFEXITED(status) && WEXITSTATUS(status) == Protocol::resourceExitStatus) {
    return {Reason::resourcesExhausted, ""};
  }
  // What it could not have is memory: the zygote had all the rest.
  if (WIFEXITED(status) && WEXITSTATUS(status) == Protocol::refusedExitStatus) {
    return {Reason::resourcesExhausted, "the machine has no memory for its worker"};
  }
  if (WIFEXITED(status)) {
    return {Reason::crashed,
            "it ended with status " + std::to_string(WEXITSTATUS(status)) + " and no answer"};
  }
  const int signal = WTERMSIG(status);
  // The kernel's limit, which stands behind the deadline: we were stopped ourselves.
  if (signal == SIGXCPU) return {Reason::timedOut, "it used up its processor time"};
  return {Reason::crashed, "signal " + std::to_string(signal) + " (" + strsignal(signal) + ")"};
}

}  // namespace

HostError lie() {
  return {Reason::protocolViolation, ""};
}

Worker::~Worker() {
  // Moved from.
  if (!service_) return;
  if (!finished_) service_->kill(slot_);
  service_->release(slot_);
}

Optional<HostError> Worker::exchange(const ClientRequest& request, Deadline deadline,
                                     ReceivedReply& reply) {
  ++served_;
  switch (channel_.exchange(request, deadline, reply)) {
    case Ending::answered:
      return std::nullopt;
    case Ending::died:
      return explainDeath();
    case Ending::violation:
      return lie();
    case Ending::late:
      break;
  }
  service_->kill(slot_);
  // A zygote that does not even kill takes its whole service with it.
  if (!service_->awaitKill(slot_, deadlineAfter(killPatience))) service_->destroy();
  return HostError(Reason::timedOut, "");
}

HostError Worker::explainDeath() {
  if (const auto exit = service_->awaitExit(slot_, deadlineAfter(exitPatience))) {
    return explain(*exit);
  }
  service_->destroy();
  return {Reason::crashed, "the service ended with it"};
}

}  // namespace Keelgate
