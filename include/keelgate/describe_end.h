// SPDX-License-Identifier: Apache-2.0
// Closes what describe_begin.h opened.

#pragma pop_macro("ENUMERATION")
#pragma pop_macro("NESTED_ENUMERATION")
#pragma pop_macro("DEFAULTING_ENUMERATION")
#pragma pop_macro("FIELD")
#pragma pop_macro("FIELD_FAMILY")
#pragma pop_macro("KEELGATE_MEMBER")
#pragma pop_macro("KEELGATE_FIELD")
#pragma pop_macro("KEELGATE_2_TO_32")
#pragma pop_macro("CODING_KEYS")
#pragma pop_macro("LABELS")
#pragma pop_macro("CASES")
