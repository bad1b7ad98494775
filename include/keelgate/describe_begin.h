// SPDX-License-Identifier: Apache-2.0
// Defines the macros of describe.h and enumeration.h. Include it after every other header, and
// describe_end.h at the end: what the includer had under these names comes back there.
// No include guard: the two are a pair of brackets.

#pragma push_macro("ENUMERATION")
#pragma push_macro("NESTED_ENUMERATION")
#pragma push_macro("DEFAULTING_ENUMERATION")
#pragma push_macro("FIELD")
#pragma push_macro("FIELD_FAMILY")
#pragma push_macro("KEELGATE_MEMBER")
#pragma push_macro("KEELGATE_FIELD")
#pragma push_macro("KEELGATE_2_TO_32")
#pragma push_macro("CODING_KEYS")
#pragma push_macro("LABELS")
#pragma push_macro("CASES")
#undef ENUMERATION
#undef NESTED_ENUMERATION
#undef DEFAULTING_ENUMERATION
#undef FIELD
#undef FIELD_FAMILY
#undef KEELGATE_MEMBER
#undef KEELGATE_FIELD
#undef KEELGATE_2_TO_32
#undef CODING_KEYS
#undef LABELS
#undef CASES

// The list twice: as the enumerators, and as text that is read at compile time. So the names in
// JSON and `describe` cannot disagree with the code.
#define ENUMERATION(Name_, Raw_, ...)                                                 \
  enum class Name_ : Raw_ { __VA_ARGS__ };                                            \
  constexpr auto keelgateCases(Name_) {                                               \
    return ::Keelgate::Detail::casesIn<::Keelgate::Detail::countNames(#__VA_ARGS__)>( \
        #__VA_ARGS__);                                                                \
  }                                                                                   \
  static_assert(true)

// Inside a class only a friend is found by its argument alone.
#define NESTED_ENUMERATION(Name_, Raw_, ...)                                          \
  enum class Name_ : Raw_ { __VA_ARGS__ };                                            \
  friend constexpr auto keelgateCases(Name_) {                                        \
    return ::Keelgate::Detail::casesIn<::Keelgate::Detail::countNames(#__VA_ARGS__)>( \
        #__VA_ARGS__);                                                                \
  }                                                                                   \
  static_assert(true)

// For codes that a newer sender may add to: an unknown number becomes `default_`.
#define DEFAULTING_ENUMERATION(Name_, Raw_, default_, ...) \
  ENUMERATION(Name_, Raw_, __VA_ARGS__);                   \
  constexpr Name_ keelgateDefault(Name_) {                 \
    return Name_::default_;                                \
  }                                                        \
  static_assert(true)

// A member, and its name or its name and wire key. A template over Self: the struct is not complete
// here, and a pointer to its member is only formed when a walker asks, by when it is.
#define FIELD(Type, member_, ...)                                 \
  Type member_;                                                   \
  template <class Self>                                           \
  static constexpr ::Keelgate::Field<Self, Type> keelgateField(   \
      ::Keelgate::Detail::Line<__LINE__>*) {                      \
    return {&Self::member_, #member_ __VA_OPT__(, ) __VA_ARGS__}; \
  }                                                               \
  static_assert(true)

// Repetition by hand: the preprocessor has no loop, and 124 lines would hide a missing one.
#define KEELGATE_2_TO_32(do_, Type, base_)                                                        \
  do_(Type, base_, 2) do_(Type, base_, 3) do_(Type, base_, 4) do_(Type, base_, 5)                 \
      do_(Type, base_, 6) do_(Type, base_, 7) do_(Type, base_, 8) do_(Type, base_, 9)             \
          do_(Type, base_, 10) do_(Type, base_, 11) do_(Type, base_, 12) do_(Type, base_, 13)     \
              do_(Type, base_, 14) do_(Type, base_, 15) do_(Type, base_, 16) do_(Type, base_, 17) \
                  do_(Type, base_, 18) do_(Type, base_, 19) do_(Type, base_, 20)                  \
                      do_(Type, base_, 21) do_(Type, base_, 22) do_(Type, base_, 23)              \
                          do_(Type, base_, 24) do_(Type, base_, 25) do_(Type, base_, 26)          \
                              do_(Type, base_, 27) do_(Type, base_, 28) do_(Type, base_, 29)      \
                                  do_(Type, base_, 30) do_(Type, base_, 31) do_(Type, base_, 32)
#define KEELGATE_MEMBER(Type, base_, number_) Type base_##number_;
#define KEELGATE_FIELD(Type, base_, number_) \
  ::Keelgate::Field<Self, Type>(&Self::base_##number_, #base_ #number_),

// The 31 numbered copies of a field, base2 to base32, each under a key like its name.
#define FIELD_FAMILY(Type, base_)                                               \
  KEELGATE_2_TO_32(KEELGATE_MEMBER, Type, base_)                                \
  template <class Self>                                                         \
  static constexpr std::array<::Keelgate::Field<Self, Type>, 31> keelgateField( \
      ::Keelgate::Detail::Line<__LINE__>*) {                                    \
    return {KEELGATE_2_TO_32(KEELGATE_FIELD, Type, base_)};                     \
  }                                                                             \
  static_assert(true)

// Close the list of a schema, or of a record. They stand below the last field: only the lines above
// them are searched.
#define CODING_KEYS(Self_) using CodingKeys = ::Keelgate::FieldList<Self_, __LINE__>
#define LABELS(Self_)      using Labels = ::Keelgate::FieldList<Self_, __LINE__>

// The case names of a struct that derives from std::variant, one for each alternative, in order.
#define CASES(Self_, ...)           \
  using variant::variant;           \
  static constexpr auto caseNames = \
      ::Keelgate::Detail::namesIn<::Keelgate::Detail::countNames(#__VA_ARGS__)>(#__VA_ARGS__)
