// The client facade: the client's construction, destruction and registration, and one line per
// operation, the commands' lines made from the catalogue. Each argument's kind follows from the
// member's parameter type, and each result is converted by its C++ type: records and strings as
// owned heap copies, bool, unsigned int, and None for void.
#include <optional>
#include <type_traits>
#include <vector>

#include "client/client.h"
#include "containers/sequence.h"
#include "protocol/catalogue.h"
#include "records/record.h"
#include "runtime/wrap.h"

namespace client3 {

namespace {

using namespace ZarvoSDKClientCPP;
using C = ZarvoPelluxPostClient;

// The client. None is passed on as no client; the library is then handed a client of its own that
// was never connected and lives for the one call, so every operation answers as unconnected.
template <class Base>
struct ClientKind : Base {
  std::optional<C> spare;
  auto get() {
    if (this->value) return this->value;
    spare.emplace();
    return static_cast<decltype(this->value)>(&*spare);
  }
};
using Client = ClientKind<Pointer<C, cat(NameOf<C>, " *"), Null::Allow>>;
using ConstClient = ClientKind<Pointer<const C, cat(NameOf<C>, " const *"), Null::Allow>>;

// A reference argument: the object itself from its proxy, never a copy; None is refused.
template <class T, Text Type>
struct Reference : Pointer<T, Type> {
  T& get() const { return *this->value; }
};
using Parameters = Reference<std::vector<Type_Parameter>, cat("std::vector< ", NameOf<Type_Parameter>, ",std::allocator< ",
                                                              NameOf<Type_Parameter>, " > > &")>;
template <class S>
using Settings = Reference<const S, cat(NameOf<S>, " const &")>;

// The kind that converts a script argument for a member's parameter of type P.
template <class P>
struct ArgKind;
template <> struct ArgKind<SafeString const&> : std::type_identity<String> {};
template <> struct ArgKind<int> : std::type_identity<Int> {};
template <> struct ArgKind<unsigned long long> : std::type_identity<UnsignedLongLong> {};
template <> struct ArgKind<bool> : std::type_identity<Bool> {};
template <> struct ArgKind<float> : std::type_identity<Float> {};
template <> struct ArgKind<double> : std::type_identity<Double> {};
template <class T>
struct ArgKind<std::vector<T> const&> : std::type_identity<SequenceArg<T>> {};
template <> struct ArgKind<std::vector<Type_Parameter>&> : std::type_identity<Parameters> {};
template <class S>
  requires std::is_base_of_v<Output_Result, S>
struct ArgKind<S const&> : std::type_identity<Settings<S>> {};

// "ZarvoPelluxPostClient_<Op>": the client (`const` for a const member) and then the member's
// parameters, each converted by its kind.
template <class F>
struct MemberLine;
template <class R, class... A>
struct MemberLine<R (C::*)(A...)> {
  template <Text Name, auto Target>
  using Line = Fn<Name, sizeof...(A) ? Tuple : Object, Target, Client, typename ArgKind<A>::type...>;
};
template <class R>
struct MemberLine<R (C::*)() const> {
  template <Text Name, auto Target>
  using Line = Fn<Name, Object, Target, ConstClient>;
};
template <Text Op, auto Target>
using Member = typename MemberLine<decltype(Target)>::template Line<cat("ZarvoPelluxPostClient_", Op), Target>;
#define CLIENT3_MEMBER(name, ...) Member<#name, &C::name>,

// The members that are not commands, and one line per command of the catalogue, in its order.
using Functions = Table<
    Fn<"new_ZarvoPelluxPostClient", NoArgs, record::Make<C>>,
    Fn<"delete_ZarvoPelluxPostClient", Object, Delete<C>, Disowned<C>>,
    Member<"Connect", &C::Connect>,
    Member<"Disconnect", &C::Disconnect>,
    Member<"IsConnected", &C::IsConnected>,
    CLIENT3_PROTOCOL_COMMANDS(CLIENT3_MEMBER)
    Member<"AllocSafeString", &C::AllocSafeString>,
    CLIENT3_MEMBER_COMMANDS(CLIENT3_MEMBER)
    Register<"ZarvoPelluxPostClient", TypeOf<C>>,
    Init<"ZarvoPelluxPostClient">>;

#undef CLIENT3_MEMBER

}  // namespace

std::span<const PyMethodDef> ClientFunctions() { return Functions::defs; }

}  // namespace client3
