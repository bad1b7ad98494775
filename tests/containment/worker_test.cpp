// SPDX-License-Identifier: Apache-2.0
/// What one worker can do to the kernel (C1, C2), to the others, to the machine and to the
/// protocol.
#include "framework/contracts/layers.h"
#include "tests/containment/machine.h"
#include "tests/containment/raw_client.h"

#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <sstream>

namespace Keelgate::Test {
namespace {

std::string readAll(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path).rdbuf();
  return text.str();
}

/// A file of a process comes to have each of these texts.
void expectIn(pid_t process, const std::string& file, const std::vector<std::string>& texts) {
  const std::string path = "/proc/" + std::to_string(process) + "/" + file;
  for (const std::string& text : texts) {
    EXPECT_TRUE(Testing::comesTrue([&] { return readAll(path).find(text) != std::string::npos; }))
        << text << " is not in\n"
        << readAll(path);
  }
}

/// A number in the status of a process.
int numberIn(pid_t process, const std::string& name) {
  std::string status = readAll("/proc/" + std::to_string(process) + "/status");
  return std::stoi(status.erase(0, status.find(name + ":\t") + name.size() + 2));
}

/// What is the same for the zygote and for a worker.
void expectSealed(pid_t process) {
  const std::string here = "/proc/" + std::to_string(process) + "/";
  expectIn(
      process, "status",
      {"NoNewPrivs:\t1\n", "Seccomp:\t2\n", "CapInh:\t0000000000000000\n",
       "CapPrm:\t0000000000000000\n", "CapEff:\t0000000000000000\n", "CapBnd:\t0000000000000000\n",
       "CapAmb:\t0000000000000000\n", "Groups:\t \n", "Uid:\t65534\t65534\t65534\t65534\n",
       "Gid:\t65534\t65534\t65534\t65534\n", "Threads:\t1\n"});
  for (const char* name : {"user", "mnt", "net", "pid", "ipc", "uts", "cgroup"}) {
    EXPECT_NE(std::filesystem::read_symlink(here + "ns/" + name),
              std::filesystem::read_symlink(std::string("/proc/self/ns/") + name))
        << name;
  }
  EXPECT_TRUE(std::filesystem::is_empty(here + "root"));
  std::istringstream maps(readAll(here + "maps"));
  for (std::string line; std::getline(maps, line);) {
    EXPECT_NE(line.substr(line.find(' ') + 2, 2), "wx") << line;
  }
  // What is not dumpable belongs to root in /proc, whoever it runs as.
  struct stat status {};
  ASSERT_EQ(stat((here + "mem").c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 0U);
}

/// The filters come last; before them it gives way to others.
void expectSealedWorker(pid_t worker, int filters, const std::string& cpuLimits) {
  expectIn(worker, "status", {"Seccomp_filters:\t" + std::to_string(filters) + '\n'});
  expectSealed(worker);
  std::set<std::string> others = descriptorsOf(worker);
  others.erase("3");
  EXPECT_TRUE(others.empty());
  expectIn(worker, "oom_score_adj", {"1000\n"});
  EXPECT_EQ(getpriority(PRIO_PROCESS, static_cast<id_t>(worker)), 19);
  expectIn(worker, "limits",
           {"Max core file size        0                    0 ",
            "Max file size             0                    0 ",
            "Max processes             0                    0 ",
            "Max open files            4                    4 ",
            "Max locked memory         0                    0 ",
            "Max msgqueue size         0                    0 ",
            "Max stack size            8388608              8388608 ",
            "Max cpu time              " + cpuLimits});
}

TEST_F(Worker, C3SeenFromOutside) {
  if (geteuid() != 0) GTEST_SKIP() << "only root may look into an undumpable process";
  for (const NamedLayer& row : namedLayers) {
    // A chroot never gives the user namespace, nor with it the right to the others.
    if ((service_.layers() & row.layer) == 0) GTEST_SKIP() << "this machine gives no " << row.name;
  }
  const pid_t zygote = service_.zygote();
  if (readAll("/proc/" + std::to_string(zygote) + "/syscall").empty()) {
    GTEST_SKIP() << "this root may not look into an undumpable process";
  }
  expectSealed(zygote);
  EXPECT_EQ(getpriority(PRIO_PROCESS, static_cast<id_t>(zygote)), getpriority(PRIO_PROCESS, 0));
  // Containers and service managers have filters of their own.
  const int ofZygote = numberIn(zygote, "Seccomp_filters");
  EXPECT_GT(ofZygote, numberIn(getpid(), "Seccomp_filters"));
  const int waiting = service_.fork(1);
  const int spinning = service_.fork(2);
  sendMessage(spinning, "spin");
  const std::vector<pid_t> workers = service_.workers(2);
  ASSERT_EQ(workers.size(), 2u);
  for (const pid_t worker : workers) {
    expectSealedWorker(worker, ofZygote + 1, "100                  101 ");
    EXPECT_EQ(descriptorsOf(worker).size(), 1u);
  }
  close(waiting);
  EXPECT_EQ(service_.end(1).exitStatus(), 0);
  service_.kill(2);
  EXPECT_EQ(service_.end(2).signal(), SIGKILL);
  close(spinning);
}

TEST_F(Worker, C3OfThoseThatAreRewound) {
  if (geteuid() != 0) GTEST_SKIP() << "only root may look into an undumpable process";
  for (int i = 0; i < 50; ++i) EXPECT_EQ(service_.obey("answer").first.result(), 0);
  // One is back and waits by then.
  usleep(50'000);
  const int channel = service_.fork(1);
  const int ofZygote = numberIn(service_.zygote(), "Seccomp_filters");
  std::size_t seen = 0;
  for (const pid_t worker : service_.workers(1)) {
    if (numberIn(worker, "TracerPid") == 0) continue;
    ++seen;
    expectSealedWorker(worker, ofZygote + 2, "202                  203 ");
  }
  if (seen == 0) GTEST_SKIP() << "this machine does not give what it takes to rewind one";
  service_.kill(1);
  EXPECT_EQ(service_.end(1).signal(), SIGKILL);
  close(channel);
}

/// How a worker fared: what its call gave back, or what ended it.
std::string outcome(const RawReply& reply, const WorkerEnd& end) {
  if (end.signal() != 0) return "signal " + std::to_string(end.signal());
  const Optional<Int64> result = reply.result();
  return result ? "result " + std::to_string(*result) : "exit " + std::to_string(end.exitStatus());
}

std::string callOrder(long call, const std::string& first) {
  return "call " + std::to_string(call) + ' ' + first + " 0 0";
}

/// All that is not ended by SIGSYS. With descriptor 0 every read is none on the channel.
const std::map<std::string, std::string> survivedOrders{
    {callOrder(SYS_read, "3"), "result 0"},
    {callOrder(SYS_write, "3"), "result 0"},
    {callOrder(SYS_exit_group, "0"), "exit 0"},
    {callOrder(SYS_exit_group, "3"), "exit 3"},
    // Refused, and not made.
    {callOrder(SYS_brk, "0"), "result 0"},
    {callOrder(SYS_brk, "3"), "result 0"},
    {callOrder(SYS_mmap, "0"), "result " + std::to_string(-ENOMEM)},
    {callOrder(SYS_mmap, "3"), "result " + std::to_string(-ENOMEM)},
    // uretprobe and uprobe of x86-64 never reach any filter: the kernel answers them before, and
    // gives what it gives to anybody who is not at a probe. Elsewhere the filter sees them.
    {callOrder(335, "0"), "signal " + std::to_string(SIGILL)},
    {callOrder(335, "3"), "signal " + std::to_string(SIGILL)},
    {callOrder(336, "0"), "result " + std::to_string(-ENXIO)},
    {callOrder(336, "3"), "result " + std::to_string(-ENXIO)},
};

TEST_F(Worker, C2EveryCallButThreeKillsIt) {
  std::vector<std::string> orders;
  for (long call = 0; call <= 600; ++call) {
    for (const char* first : {"0", "3"}) {
      orders.push_back(callOrder(call, first));
      orders.push_back(callOrder(call + 0x4000'0000, first));
      if (hasOtherGates) orders.push_back("int80 " + std::to_string(call) + ' ' + first);
    }
  }
  for (const long call : {-1L, 2147483648, 4294967295}) orders.push_back(callOrder(call, "3"));
  for (int slot = 0; hasOtherGates && slot < 3; ++slot) {
    orders.push_back("vsyscall " + std::to_string(slot));
  }
  // A window of workers at once.
  std::map<std::size_t, int> channels;
  std::size_t survivors = 0;
  for (std::size_t next = 0, done = 0; done < orders.size(); ++done) {
    for (; next < orders.size() && next < done + 32; ++next) {
      channels[next] = service_.fork(static_cast<std::uint32_t>(next));
      sendMessage(channels[next], orders[next]);
    }
    const std::string& order = orders[done];
    const RawReply reply = receiveReply(channels[done]);
    close(channels[done]);
    const WorkerEnd end = service_.end(static_cast<std::uint32_t>(done));
    const auto survived = survivedOrders.find(order);
    const bool survives = survived != survivedOrders.end();
    survivors += survives ? 1 : 0;
    // A kernel may have no vsyscall page at all.
    if (order.starts_with("vsyscall") && end.signal() == SIGSEGV) continue;
    if (order.starts_with("call 33") && end.signal() == SIGSYS) continue;
    EXPECT_EQ(outcome(reply, end), survives ? survived->second : "signal " + std::to_string(SIGSYS))
        << order;
  }
  EXPECT_EQ(survivors, survivedOrders.size());
}

TEST_F(Worker, C5ProcessorTimeIsLimitedWithoutTheClient) {
  // Whatever whoever starts it has done with the signal.
  const auto ignore = [] {
    signal(SIGXCPU, SIG_IGN);
  };
  RawClient service(OBEDIENT_SERVICE, {.messages = 1, .cpuSeconds = 1, .before = ignore});
  EXPECT_EQ(service.obey("spin").second.signal(), SIGXCPU);
}

TEST_F(Worker, LogIsCutInNumberAndLength) {
  EXPECT_EQ(service_.obey("log 2 5").first.log, std::vector<std::string>(2, "xxxxx"));
  EXPECT_EQ(service_.obey("log 9 513").first.log,
            std::vector<std::string>(Protocol::maximumLogFrames,
                                     std::string(Protocol::maximumLogLength, 'x')));
}

TEST_F(Worker, WrongHeadersEndItAndMissingOnesDoNot) {
  const auto right = Protocol::makeRequestHeader(0, 0, 0, 0, 0);
  auto otherMagic = right, otherVersion = right;
  ++otherMagic.magic;
  ++otherVersion.version;
  // Another's sequence, longer than what the worker was made for, and right but cut short.
  const std::tuple<Protocol::RequestHeader, std::size_t, int> rows[] = {
      {Protocol::makeRequestHeader(0, 0, 0, 0, 1), 0, Protocol::protocolExitStatus},
      {Protocol::makeRequestHeader(0, 0, 0, shortMessage + 1, 0), 0, Protocol::protocolExitStatus},
      {Protocol::makeRequestHeader(0, 0, Protocol::maximumServiceLength + 1, 0, 0), 0,
       Protocol::protocolExitStatus},
      {otherMagic, 0, Protocol::protocolExitStatus},
      {otherVersion, 0, Protocol::protocolExitStatus},
      {right, 1, 0}};
  for (const auto& [header, missing, status] : rows) {
    const int channel = service_.fork(0);
    send(channel, &header, sizeof header - missing, MSG_NOSIGNAL);
    shutdown(channel, SHUT_WR);
    EXPECT_FALSE(receiveReply(channel).kind);
    close(channel);
    EXPECT_EQ(service_.end(0).exitStatus(), status);
  }
}

TEST(Zygote, RefusesEveryFrameThatIsNotExactlyRight) {
  using Protocol::ControlKind;
  for (const auto& [kind, slot] : {std::pair(ControlKind::hello, 0U),
                                   {ControlKind::exit, 0U},
                                   {ControlKind{99}, 0U},
                                   {ControlKind::fork, 0U},
                                   {ControlKind::fork, 3U}}) {
    RawClient service(OBEDIENT_SERVICE);
    // It holds the slot of the last case, whose frame is right otherwise.
    const int held = service.fork(3);
    service.kill(12345);
    service.sendFrame(kind, slot, {shortMessage}, slot == 3 ? held : -1);
    Protocol::ControlFrame frame = service.receiveFrame();
    while (frame.kind == ControlKind::exit) frame = service.receiveFrame();
    EXPECT_EQ(frame.kind, ControlKind::refused) << static_cast<int>(kind) << slot;
    EXPECT_EQ(frame.numbers[0], static_cast<std::uint64_t>(StartStep::readFrame))
        << static_cast<int>(kind) << slot;
    EXPECT_EQ(service.stop(), Protocol::refusedExitStatus) << static_cast<int>(kind) << slot;
    close(held);
  }
}

TEST(Zygote, NobodyOutlivesTheOther) {
  for (const bool killLauncher : {false, true}) {
    RawClient service(OBEDIENT_SERVICE);
    ASSERT_TRUE(service.ready()) << service.refusal();
    const int channel = service.fork(0);
    sendMessage(channel, "spin");
    if (killLauncher) {
      ::kill(service.launcher(), SIGKILL);
      EXPECT_EQ(service.receiveFrame().magic, 0U) << "the control channel ends with the zygote";
    }
    EXPECT_EQ(service.stop(), killLauncher ? 128 + SIGKILL : 0);
    // The end of its channel is the end of the worker.
    char byte = 0;
    EXPECT_LE(recv(channel, &byte, 1, 0), 0);
    close(channel);
  }
}

}  // namespace
}  // namespace Keelgate::Test
