// SPDX-License-Identifier: Apache-2.0
/// C11: the service under machines and profiles that lack something, each imitated by a filter that
/// refuses a call, or by taking a right away, before the service is executed.
#include "framework/contracts/layers.h"
#include "tests/containment/raw_client.h"

#include <keelgate/client.h>

#include <grp.h>
#include <linux/filter.h>
#include <linux/sched.h>
#include <linux/seccomp.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>

#include <csignal>

namespace Keelgate::Test {
namespace {

/// `call` fails with `error` when one of its arguments has one of the bits, or always.
struct Refused {
  int call;
  unsigned error;
  unsigned bits = 0;
  unsigned argument = 0;
};

void refuseCalls(const std::vector<Refused>& rows) {
  std::vector<sock_filter> program;
  const auto add = [&program](std::initializer_list<sock_filter> lines) {
    program.insert(program.end(), lines);
  };
  for (const auto& [call, error, bits, argument] : rows) {
    const unsigned char skipped = bits == 0 ? 1 : 3;
    const auto from = static_cast<unsigned>(offsetof(seccomp_data, args) + 8 * argument);
    add({BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
         BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(call), 0, skipped)});
    if (bits != 0) {
      add({BPF_STMT(BPF_LD | BPF_W | BPF_ABS, from),
           BPF_JUMP(BPF_JMP | BPF_JSET | BPF_K, bits, 0, 1)});
    }
    add({BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | error)});
  }
  program.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW));
  const sock_fprog handed{.len = static_cast<unsigned short>(program.size()),
                          .filter = program.data()};
  // Without no_new_privs where it can be, so that the service has to set it itself.
  if (syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &handed) == 0) return;
  prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
  if (syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &handed) != 0) _exit(126);
}

void becomeUser(const std::vector<gid_t>& with) {
  if (setgroups(with.size(), with.data()) != 0 || setresgid(1000, 1000, 1000) != 0 ||
      setresuid(1000, 1000, 1000) != 0) {
    _exit(126);
  }
}

/// Goes on in a new process namespace, whose list of processes nobody has mounted.
void becomeFirstProcess() {
  if (unshare(CLONE_NEWPID) != 0) _exit(126);
  const pid_t first = fork();
  if (first == 0) return;
  // The channel is the service's alone.
  closefrom(STDERR_FILENO + 1);
  int status = 0;
  waitpid(first, &status, 0);
  _exit(WIFEXITED(status) ? WEXITSTATUS(status) : 126);
}

constexpr unsigned namespaces = layerUserNamespace | layerPidNamespace | layerMountNamespace |
                                layerNetworkNamespace | layerIpcNamespace | layerUtsNamespace |
                                layerCgroupNamespace | layerEmptyRoot;
constexpr unsigned allNamespaceFlags = CLONE_NEWUSER | CLONE_NEWPID | CLONE_NEWNS | CLONE_NEWNET |
                                       CLONE_NEWIPC | CLONE_NEWUTS | CLONE_NEWCGROUP;

const Refused noClone{SYS_clone, EPERM, allNamespaceFlags};
const Refused noUnshare{SYS_unshare, EPERM};
const Refused noUsers{SYS_clone, ENOSPC, CLONE_NEWUSER};
const Refused noMaps{SYS_openat, EACCES, O_WRONLY, 2};

using Groups = Optional<std::vector<gid_t>>;
const Groups root = std::nullopt;
const Groups noGroups = std::vector<gid_t>();
const Groups groups = std::vector<gid_t>{1000, 27};

/// Holds a copy of the service where a user may read it, and inside the chroot. No mount point, or
/// the chroot would be like any other root.
const std::string folder = "/var/tmp/keelgate-" + std::to_string(getpid());

std::uint64_t whole() {
  static const std::uint64_t layers = RawClient(OBEDIENT_SERVICE).layers();
  return layers;
}

// What an environment takes for granted of the machine; of a container, perhaps, it is not so.
bool nothing() {
  return true;
}
bool userNamespaces() {
  return (whole() & layerUserNamespace) != 0;
}
/// With the rights that they bring: security modules take these away.
bool usersNamespaces() {
  return Testing::inFork([] {
           becomeUser({});
           return unshare(CLONE_NEWUSER | CLONE_NEWNS) == 0 &&
                  mount("", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0;
         }) == 1;
}
/// To make namespaces without a user namespace.
bool privilege() {
  return Testing::inFork([] { return unshare(CLONE_NEWNS | CLONE_NEWPID) == 0; }) == 1;
}

void nothingTaken() {}
struct Environment {
  std::string name;
  std::vector<Refused> refused = {};
  /// Second walls that are missing then.
  unsigned missing = 0;
  /// The caller is a user with these groups, and not root.
  Groups user = root;
  /// Without it this environment is another.
  bool (*needs)() = nothing;
  void (*before)() = nothingTaken;
  /// Part of the sentence of a service that refuses.
  std::string refusal = {};
};

void enterRoot() {
  if (chroot(folder.c_str()) != 0 || chdir("/") != 0) _exit(126);
}
void ignoreSignals() {
  for (int number = 1; number < NSIG; ++number) std::signal(number, SIG_IGN);
}

template <__rlimit_resource what, rlim_t amount>
void allowOnly() {
  const rlimit small{.rlim_cur = amount, .rlim_max = amount};
  setrlimit(what, &small);
}

/// A service that refuses with this sentence.
Environment refusing(std::string name, const char* sentence, std::vector<Refused> refused,
                     void (*before)() = nothingTaken) {
  return {std::move(name), std::move(refused), 0, root, nothing, before, sentence};
}

const std::vector<Environment> environments{
    {"nothing taken away"},
    {"a container's profile, as root",
     {noClone, noUnshare, {SYS_mount, EPERM}, {SYS_pivot_root, EPERM}},
     namespaces},
    {"a profile, as a user", {noClone, noUnshare}, namespaces | layerNoSupplementaryGroups, groups},
    {"a user", {}, 0, noGroups, usersNamespaces},
    {"a user with his groups", {}, layerNoSupplementaryGroups, groups, usersNamespaces},
    {"no user namespace, as root", {noUsers}, layerUserNamespace, root, privilege},
    {"no user namespace, as a user", {noUsers}, namespaces, noGroups},
    {"maps refused, as root", {noMaps}, layerUserNamespace, root, privilege},
    {"maps refused, as a user", {noMaps}, layerUserNamespace, noGroups, usersNamespaces},
    {"another's process list", {}, layerUserNamespace, root, privilege, becomeFirstProcess},
    {"no process namespace", {{SYS_clone, EINVAL, CLONE_NEWPID}}, layerPidNamespace},
    {"mounting refused by a security module", {{SYS_mount, EACCES}}, layerEmptyRoot},
    {"one namespace unknown", {{SYS_unshare, EINVAL, CLONE_NEWCGROUP}}, layerCgroupNamespace},
    {"root that may not change its identifiers, and no namespaces",
     {noClone, noUnshare, {SYS_setresuid, EPERM}, {SYS_setresgid, EPERM}},
     namespaces | layerNotRoot},
    {"a kernel without Landlock", {{SYS_landlock_create_ruleset, ENOSYS}}, layerLandlock},
    {"Landlock switched off", {{SYS_landlock_create_ruleset, EOPNOTSUPP}}, layerLandlock},
    {"tracing refused", {{SYS_ptrace, EPERM}}},
    {"tracking of pages refused", {{SYS_userfaultfd, EPERM}}},
    {"a kernel without lists of written pages", {{SYS_ioctl, ENOTTY, 0x4400, 1}}},
    {"no notices of a filter", {{SYS_seccomp, EINVAL, SECCOMP_FILTER_FLAG_NEW_LISTENER, 1}}},
    {"no list of the own processes", {{SYS_fsopen, ENOSYS}}},
    {"few descriptors", {}, 0, root, userNamespaces, allowOnly<RLIMIT_NOFILE, 24>},
    {"a kernel without close_range", {{SYS_close_range, ENOSYS}}},
    // A user namespace is refused in there; the process still becomes nobody.
    {"chroot", {}, layerUserNamespace | layerEmptyRoot, root, privilege, enterRoot},
    {"signals ignored by the one who starts it", {}, 0, root, nothing, ignoreSignals},
    refusing("seccomp refused", "allow seccomp", {{SYS_seccomp, EPERM}}),
    refusing("limits refused", "resource limits", {{SYS_prlimit64, EPERM}}),
    refusing("prctl refused", "allow prctl", {{SYS_prctl, EPERM}}),
    {"capabilities kept", {{SYS_capset, EPERM}}, 0, root, userNamespaces, nothingTaken, "capset"},
    refusing("no process to be had", "ulimit -u", {{SYS_clone, EAGAIN}}),
    refusing("not even for the service", "pids.max); it is not tried again",
             {{SYS_clone, EAGAIN}, {SYS_clone3, EAGAIN}}),
    refusing("too little stack", "ulimit -H -s", {}, allowOnly<RLIMIT_STACK, 1 << 20>),
    refusing("an address space that is too small", "ulimit -v", {}, allowOnly<RLIMIT_AS, 64 << 20>),
};

/// In the environment of the calling process, for good: what its client's service has and answers,
/// or why there is none.
std::string seenByClient(const std::string& service) {
  Client::Options options;
  options.servicePath = service;
  options.log = [](std::string_view) {
  };
  std::string text;
  try {
    Client client(options);
    for (const SandboxLayer& layer : client.report().layers) {
      if (layer.present) text += layer.name + '\n';
    }
    const auto send = [&client](std::string_view order) {
      client.unpack<VespCommandResponse>(std::as_bytes(std::span(order)));
    };
    // As many as it takes to rewind workers, or to find out that it cannot be done.
    for (int i = 0; i < 100; ++i) send("answer");
    text += "answer";
    send("call 39");
    return text;
  } catch (const HostError& error) {
    if (error.reason == HostError::Reason::crashed) return text + "and a crash";
    return error.reason == HostError::Reason::startFailed ? error.description : "another reason";
  }
}

class EnvironmentTest : public testing::TestWithParam<Environment> {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "only root can imitate every environment";
    if (!GetParam().needs()) GTEST_SKIP() << "this machine does not give what it takes away";
  }
  static void SetUpTestSuite() {
    std::filesystem::create_directory(folder);
    std::filesystem::copy_file(OBEDIENT_SERVICE, folder + "/service");
    for (const std::string& made : {folder, folder + "/service"}) {
      std::filesystem::permissions(made, std::filesystem::perms(0755));
    }
  }
  static void TearDownTestSuite() { std::filesystem::remove_all(folder); }
};

TEST(C11, OneDescriptorIsTrueWithoutCloseRange) {
  RawOptions options;
  options.before = [] {
    for (const int left : {9, 100, 200}) dup2(STDERR_FILENO, left);
    refuseCalls({{SYS_close_range, ENOSYS}});
  };
  RawClient service(OBEDIENT_SERVICE, options);
  ASSERT_TRUE(service.ready()) << service.refusal();
  const int channel = service.fork(1);
  const pid_t worker = service.workers(1).at(0);
  try {
    const std::set<std::string> one{"3"};
    EXPECT_TRUE(Testing::comesTrue([&] { return descriptorsOf(worker) == one; }));
    // The channel, the tether, and the deaths of its workers; where these can be rewound, three
    // more. The worker's end goes after the fork.
    EXPECT_TRUE(Testing::comesTrue([&] {
      const std::size_t count = descriptorsOf(service.zygote()).size();
      return count == 3 || count == 6;
    }));
  } catch (const std::filesystem::filesystem_error& error) {
    GTEST_SKIP() << error.what();
  }
  close(channel);
}

/// A whole application in that environment, its client included.
TEST_P(EnvironmentTest, RunsAndReportsOrRefusesWithReason) {
  const Environment& environment = GetParam();
  std::string expected;
  for (const NamedLayer& row : namedLayers) {
    if ((whole() & ~std::uint64_t{environment.missing} & row.layer) == 0) continue;
    expected += std::string(row.name) + '\n';
  }
  const auto trial = [&] {
    environment.before();
    if (!environment.refused.empty()) refuseCalls(environment.refused);
    if (environment.user) becomeUser(*environment.user);
    const std::string service = folder + "/service";
    const auto seen = seenByClient(access(service.c_str(), X_OK) == 0 ? service : "/service");
    if (environment.refusal.empty()) {
      EXPECT_EQ(seen, expected + "answer" + "and a crash");
    } else {
      EXPECT_NE(seen.find(environment.refusal), std::string::npos) << seen;
    }
    return HasFailure();
  };
  EXPECT_EQ(Testing::inFork(trial), 0);
}

INSTANTIATE_TEST_SUITE_P(C11, EnvironmentTest, testing::ValuesIn(environments),
                         [](const auto& row) {
                           std::string name;
                           for (const char c : row.param.name)
                             name += std::isalnum(c) != 0 ? c : '_';
                           return name;
                         });

}  // namespace
}  // namespace Keelgate::Test
