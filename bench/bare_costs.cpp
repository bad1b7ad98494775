// SPDX-License-Identifier: Apache-2.0
// The least that a message could cost on this machine, as small a process as can be made: what the
// rows of stream_rows.cpp are held against. Prints three numbers, in microseconds: the time of a
// fork that exits and is waited for, its processor time, and the time of a message of 2,150 bytes
// that a socket takes to a process and back, 32 of them at a time.
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <ctime>
#include <initializer_list>

namespace {

double now() {
  timespec time;
  clock_gettime(CLOCK_MONOTONIC, &time);
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

double processorTime() {
  double sum = 0;
  for (const auto who : {RUSAGE_SELF, RUSAGE_CHILDREN}) {
    rusage used;
    getrusage(who, &used);
    for (const timeval& part : {used.ru_utime, used.ru_stime}) {
      sum += static_cast<double>(part.tv_sec) * 1e6 + static_cast<double>(part.tv_usec);
    }
  }
  return sum;
}

bool moveAll(ssize_t (*move)(int, void*, size_t), int channel, char* bytes, size_t size) {
  while (size > 0) {
    const ssize_t n = move(channel, bytes, size);
    if (n <= 0) return false;
    bytes += n;
    size -= static_cast<size_t>(n);
  }
  return true;
}

constexpr int forks = 1000;
constexpr int batches = 2000;
constexpr int perBatch = 32;
char batch[perBatch * 2150];

ssize_t give(int channel, void* from, size_t size) {
  return write(channel, from, size);
}

double pipelined() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) return -1;
  if (fork() == 0) {
    close(ends[0]);
    while (moveAll(read, ends[1], batch, sizeof batch)) moveAll(give, ends[1], batch, sizeof batch);
    _exit(0);
  }
  close(ends[1]);
  const double begin = now();
  for (int i = 0; i < batches; ++i) {
    if (!moveAll(give, ends[0], batch, sizeof batch)) return -1;
    if (!moveAll(read, ends[0], batch, sizeof batch)) return -1;
  }
  const double end = now();
  close(ends[0]);
  wait(nullptr);
  return (end - begin) / (batches * perBatch);
}

}  // namespace

int main() {
  const double begin = now();
  const double beginUsed = processorTime();
  for (int i = 0; i < forks; ++i) {
    const pid_t pid = fork();
    if (pid == 0) _exit(0);
    waitpid(pid, nullptr, 0);
  }
  std::printf("%f %f", (now() - begin) / forks, (processorTime() - beginUsed) / forks);
  std::printf(" %f\n", pipelined());
}
