// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/worker_state.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/rseq.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <system_error>

namespace Keelgate::Rewind {

namespace {

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

/// What counts and cannot be read by the process itself.
constexpr std::array counting{"State:",
                              "SigQ:",
                              "VmHWM:",
                              "VmRSS:",
                              "RssAnon:",
                              "RssFile:",
                              "VmPTE:",
                              "voluntary_ctxt_switches:",
                              "nonvoluntary_ctxt_switches:",
                              "Cpus_allowed"};

bool isCounting(const std::string& line) {
  return std::any_of(counting.begin(), counting.end(),
                     [&](const char* name) { return line.starts_with(name); });
}

void readLines(const std::string& path, std::vector<std::string>& lines) {
  std::ifstream file(path);
  for (std::string line; std::getline(file, line);) {
    if (!isCounting(line)) lines.push_back(line);
  }
}

void readPages(int memory, std::uint64_t begin, std::uint64_t end, WorkerState& state) {
  for (std::uint64_t at = begin; at < end; at += pageSize) {
    std::vector<std::byte> bytes(pageSize);
    // Beyond the end of a file there is nothing to read, and nothing to write either.
    if (pread(memory, bytes.data(), bytes.size(), static_cast<off_t>(at)) > 0) {
      state.pages.emplace(at, std::move(bytes));
    }
  }
}

/// Only what is there: to read the rest would bring it there.
void readPresent(int pages, int memory, const Mapping& mapping, WorkerState& state) {
  std::vector<PageRun> runs(4096);
  PageScan order{.size = sizeof order,
                 .flags = 0,
                 .start = mapping.begin,
                 .end = mapping.end,
                 .walkEnd = 0,
                 .runs = reinterpret_cast<std::uint64_t>(runs.data()),
                 .runCount = runs.size(),
                 .maximumPages = 0,
                 .invertedCategories = 0,
                 .allOf = 0,
                 .anyOf = pageIsPresent | pageIsSwapped,
                 .reported = pageIsPresent};
  const int found = ioctl(pages, scanPages, &order);
  if (found < 0 || order.walkEnd != mapping.end) fail("scan of pages");
  runs.resize(static_cast<std::size_t>(found));
  for (const PageRun& run : runs) readPages(memory, run.begin, run.end, state);
}

/// Where the kernel writes the number of the processor, for each thread.
std::uint64_t processorNumber(const WorkerState& state) {
  return state.registers.general.fs_base + static_cast<std::uint64_t>(__rseq_offset);
}

std::size_t differing(const std::byte* one, const std::byte* other, std::size_t size) {
  std::size_t count = 0;
  for (std::size_t i = 0; i < size; ++i) count += one[i] != other[i] ? 1U : 0U;
  return count;
}

std::size_t differingMemory(const WorkerState& before, const WorkerState& after) {
  static const std::vector<std::byte> zeros(pageSize);
  // Two numbers in front of the pointer to a critical section, and two behind its flags.
  constexpr std::size_t numbers = 8;
  constexpr std::size_t behind = 20;
  constexpr std::size_t area = 32;
  const std::uint64_t own = processorNumber(before);
  std::size_t count = 0;
  const auto count1 = [&](std::uint64_t address, std::vector<std::byte> one,
                          std::vector<std::byte> other) {
    for (std::size_t i = 0; i < area; ++i) {
      const bool counted = i >= numbers && i < behind;
      if (counted || own + i < address || own + i >= address + pageSize) continue;
      one[own + i - address] = other[own + i - address] = std::byte{};
    }
    count += differing(one.data(), other.data(), pageSize);
  };
  for (const auto& [address, bytes] : before.pages) {
    const auto there = after.pages.find(address);
    count1(address, bytes, there == after.pages.end() ? zeros : there->second);
  }
  for (const auto& [address, bytes] : after.pages) {
    if (!before.pages.contains(address)) count1(address, bytes, zeros);
  }
  return count;
}

}  // namespace

WorkerState lookAt(pid_t process) {
  WorkerState state;
  const std::string directory = "/proc/" + std::to_string(process) + '/';
  if (!readRegisters(process, state.registers)) fail("registers");
  const File memory(open((directory + "mem").c_str(), O_RDONLY | O_CLOEXEC));
  const File pages(open((directory + "pagemap").c_str(), O_RDONLY | O_CLOEXEC));
  const File mappings(open((directory + "maps").c_str(), O_RDONLY | O_CLOEXEC));
  for (const Mapping& mapping : readMappings(mappings.get())) {
    if (mapping.isKernels) continue;
    if (mapping.ofFile && !mapping.writable) {
      readPages(memory.get(), mapping.begin, mapping.end, state);
    } else {
      readPresent(pages.get(), memory.get(), mapping, state);
    }
  }
  for (const char* name : {"maps", "limits", "status"}) readLines(directory + name, state.figures);
  for (const auto& descriptor : std::filesystem::directory_iterator(directory + "fd")) {
    state.figures.push_back("fd " + descriptor.path().filename().string());
  }
  return state;
}

Difference compare(const WorkerState& before, const WorkerState& after) {
  Difference difference;
  difference.memory = differingMemory(before, after);
  difference.general = differing(reinterpret_cast<const std::byte*>(&before.registers.general),
                                 reinterpret_cast<const std::byte*>(&after.registers.general),
                                 sizeof before.registers.general);
  difference.extended =
      differing(before.registers.extended.data(), after.registers.extended.data(),
                std::min(before.registers.extended.size(), after.registers.extended.size()));
  for (std::size_t i = 0; i < std::max(before.figures.size(), after.figures.size()); ++i) {
    const std::string one = i < before.figures.size() ? before.figures[i] : "";
    const std::string other = i < after.figures.size() ? after.figures[i] : "";
    if (one != other) difference.figures.push_back(other);
  }
  return difference;
}

}  // namespace Keelgate::Rewind
