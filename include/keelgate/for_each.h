// SPDX-License-Identifier: Apache-2.0
/// KEELGATE_FOR_EACH(macro, (a, b), (c), …) becomes macro(a, b) macro(c) …: all descriptions in
/// these headers are built on it. A list is written once and expanded several times: as members, as
/// names, as the cases of a switch.
///
/// The preprocessor does not expand a macro within itself. A step therefore leaves the name of the
/// next one unfinished, and KEELGATE_EXPAND scans the line again until all steps are done: 64
/// times, for four items each, so a list may have 256.
#pragma once

#define KEELGATE_FOR_EACH(macro, ...) \
  __VA_OPT__(KEELGATE_EXPAND(KEELGATE_STEP_1(macro, __VA_ARGS__)))

#define KEELGATE_STEP_1(macro, item, ...) macro item __VA_OPT__(KEELGATE_STEP_2(macro, __VA_ARGS__))
#define KEELGATE_STEP_2(macro, item, ...) macro item __VA_OPT__(KEELGATE_STEP_3(macro, __VA_ARGS__))
#define KEELGATE_STEP_3(macro, item, ...) macro item __VA_OPT__(KEELGATE_STEP_4(macro, __VA_ARGS__))
#define KEELGATE_STEP_4(macro, item, ...) \
  macro item __VA_OPT__(KEELGATE_AGAIN KEELGATE_PARENS(macro, __VA_ARGS__))
#define KEELGATE_AGAIN() KEELGATE_STEP_1
#define KEELGATE_PARENS  ()

#define KEELGATE_EXPAND(...) \
  KEELGATE_EXPAND_16(KEELGATE_EXPAND_16(KEELGATE_EXPAND_16(KEELGATE_EXPAND_16(__VA_ARGS__))))
#define KEELGATE_EXPAND_16(...) \
  KEELGATE_EXPAND_4(KEELGATE_EXPAND_4(KEELGATE_EXPAND_4(KEELGATE_EXPAND_4(__VA_ARGS__))))
#define KEELGATE_EXPAND_4(...) \
  KEELGATE_EXPAND_1(KEELGATE_EXPAND_1(KEELGATE_EXPAND_1(KEELGATE_EXPAND_1(__VA_ARGS__))))
#define KEELGATE_EXPAND_1(...) __VA_ARGS__
