// SPDX-License-Identifier: Apache-2.0
// Put before every source of a build with faults in it: which of them is on.
#pragma once

/// Shared with the test runner through a file. Nobody may assume that the others of the list are
/// off while one is looked at: the runner changes `active` only between runs.
struct KeelgateFaults {
  int active;
  unsigned char reached[];
};
extern "C" KeelgateFaults* keelgateFaults;

/// What is evaluated by the compiler has no faults.
constexpr bool keelgateFault(int number) {
  if (__builtin_is_constant_evaluated()) return false;
  keelgateFaults->reached[number] = 1;
  return keelgateFaults->active == number;
}
