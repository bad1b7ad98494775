// SPDX-License-Identifier: Apache-2.0
/// Marks what the shared library shows. Errors are marked whole, with their type information, so
/// that what is thrown inside the library is caught by its type outside of it.
#pragma once

#define KEELGATE_API __attribute__((visibility("default")))
