// Record families as table entries. A record is one `Record<X, Members...>` (or `Creatable<...>` for
// the records that scripts construct themselves), whose members are its fields and its member
// functions in table order:
//
//   Record<Output_GetServerInfo, Field<"Program", &Output_GetServerInfo::Program>, ...>
//
// expands to delete_X, X_F_set / X_F_get per field, X_M per member function and X_swigregister;
// Creatable adds new_X in front and X_swiginit at the end. How a field is converted follows from
// its C++ type.
#pragma once

#include <cstddef>
#include <span>
#include <type_traits>
#include <vector>

#include "convert/scalar.h"
#include "convert/text.h"
#include "runtime/wrap.h"
#include "types/types.h"

namespace client3 {

// Type_Parameter's and the Output_* records' module functions (records.cpp).
std::span<const PyMethodDef> RecordFunctions();

namespace record {

using ZarvoSDKClientCPP::ResultCode::Enum;
using ZarvoSDKClientCPP::SafeString;
using ZarvoSDKClientCPP::Type_Parameter;

// The class name without its namespace, as the module's function names spell it.
template <std::size_t Skip, std::size_t N>
constexpr auto Drop(const Text<N>& text) {
  Text<N - Skip> out;
  for (std::size_t i = 0; i + Skip < N; ++i) out.chars[i] = text.chars[i + Skip];
  return out;
}
template <class X>
inline constexpr auto ClassName = Drop<sizeof("ZarvoSDKClientCPP::") - 1>(NameOf<X>);

// The spelling of an element type inside the vector type texts.
template <class T>
inline constexpr auto ElementName = NameOf<T>;
template <>
inline constexpr auto ElementName<bool> = Text{"bool"};
template <>
inline constexpr auto ElementName<int> = Text{"int"};
template <>
inline constexpr auto ElementName<unsigned long long> = Text{"unsigned long long"};
template <>
inline constexpr auto ElementName<float> = Text{"float"};
template <>
inline constexpr auto ElementName<double> = Text{"double"};

// The kind that converts a script value for a field of type T (argument 2 of its setter).
template <class T>
struct KindOf;
template <>
struct KindOf<int> : std::type_identity<Int> {};
template <>
struct KindOf<unsigned int> : std::type_identity<UnsignedInt> {};
template <>
struct KindOf<unsigned long long> : std::type_identity<UnsignedLongLong> {};
template <>
struct KindOf<bool> : std::type_identity<Bool> {};
template <>
struct KindOf<float> : std::type_identity<Float> {};
template <>
struct KindOf<double> : std::type_identity<Double> {};
template <>
struct KindOf<Enum> : std::type_identity<EnumKind<Enum, "ZarvoSDKClientCPP::ResultCode::Enum">> {};
// Text and vector fields take a proxy; None would be a null source and is refused.
template <>
struct KindOf<SafeString> : std::type_identity<Pointer<SafeString, "ZarvoSDKClientCPP::SafeString *">> {};
template <class E>
struct KindOf<std::vector<E>>
    : std::type_identity<Pointer<std::vector<E>,
                                 cat("std::vector< ", ElementName<E>, ",std::allocator< ", ElementName<E>, " > > *")>> {};

template <class M>
struct MemberOf;
template <class C, class T>
struct MemberOf<T C::*> {
  using Class = C;
  using Type = T;
};

// Fields held by value in a script are numbers; the others are reached through proxies.
template <class T>
inline constexpr bool Scalar = std::is_arithmetic_v<T> || std::is_enum_v<T>;

// A record argument of a setter: None is a null record, into which nothing is stored.
template <class X>
using Target = Pointer<X, cat(NameOf<X>, " *"), Null::Allow>;

template <auto Member>
inline constexpr auto Set = [](typename MemberOf<decltype(Member)>::Class* record, auto value) {
  if constexpr (Scalar<typename MemberOf<decltype(Member)>::Type>) {
    if (record) record->*Member = value;
  } else {
    // The value is a proxy's object, never null; assigning a field to itself changes nothing.
    if (record && &(record->*Member) != value) record->*Member = *value;
  }
};

template <auto Member>
inline constexpr auto Get = [](typename MemberOf<decltype(Member)>::Class* record) {
  using T = typename MemberOf<decltype(Member)>::Type;
  if constexpr (std::is_enum_v<T>)
    return static_cast<int>(record->*Member);
  else if constexpr (Scalar<T>)
    return record->*Member;
  else
    return Borrowed<T>{&(record->*Member)};
};

// The object of a member function, `X const *` for a const one.
template <class F>
struct SelfOf;
template <class R, class C>
struct SelfOf<R (C::*)()> : std::type_identity<Self<C>> {
  using Class = C;
};
template <class R, class C>
struct SelfOf<R (C::*)() const> : std::type_identity<ConstSelf<C>> {
  using Class = C;
};

template <class X>
inline constexpr auto Make = [] { return Owned<X, PointerOwn | PointerNoShadow>{new X()}; };

// A field: its setter and getter.
template <Text Name, auto Member>
struct Field {
  using Class = typename MemberOf<decltype(Member)>::Class;
  using Type = typename MemberOf<decltype(Member)>::Type;
  template <Text X>
  using Lines = Table<Fn<cat(X, "_", Name, "_set"), Tuple, Set<Member>, Target<Class>,
                         typename KindOf<Type>::type>,
                      Fn<cat(X, "_", Name, "_get"), Object, Get<Member>, Self<Class>>>;
};

// A member function without arguments; its result is converted here, where the text conversion is
// known.
template <auto Function>
inline constexpr auto Converted = [](auto* self) { return ToPython((self->*Function)()); };
template <Text Name, auto Function>
struct Method {
  using Class = typename SelfOf<decltype(Function)>::Class;
  template <Text X>
  using Lines = Fn<cat(X, "_", Name), Object, Converted<Function>, typename SelfOf<decltype(Function)>::type>;
};

// A record that scripts receive from the client: delete_X, its members, X_swigregister.
template <class X, class... Members>
struct Record {
  static_assert((std::is_same_v<typename Members::Class, X> && ...), "a member of another class");
  static constexpr auto name = ClassName<X>;
  static constexpr auto defs = Join(Fn<cat("delete_", name), Object, Delete<X>, Disowned<X>>::defs,
                                    Members::template Lines<name>::defs..., Register<name, TypeOf<X>>::defs);
};

// A record that scripts also construct: new_X (zero-filled) in front and X_swiginit at the end.
template <class X, class... Members>
struct Creatable {
  static constexpr auto name = ClassName<X>;
  static constexpr auto defs = Join(Fn<cat("new_", name), NoArgs, Make<X>>::defs, Record<X, Members...>::defs,
                                    Init<name>::defs);
};

}  // namespace record

}  // namespace client3
