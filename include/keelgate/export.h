// SPDX-License-Identifier: Apache-2.0
/// Marks what the shared library exports. Errors are exported with their type information, so that
/// what is thrown inside the library can be caught by its type outside.
#pragma once

#define KEELGATE_API __attribute__((visibility("default")))
