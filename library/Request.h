// One operation of the client as one request: its arguments are written as the command's inputs,
// and the reply's outputs are read into the fields of the result record, both in the order the
// command's declaration gives. The declaration and the C++ types are checked against each other at
// compile time.
#pragma once

#include <charconv>
#include <cstdlib>
#include <string>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "library/Connection.h"
#include "protocol/catalogue.h"
#include "protocol/wire.h"

namespace ZarvoSDKClientCPP {

namespace request {

using client3::protocol::CommandOf;
using client3::protocol::DecodeError;
using client3::protocol::Id;
using client3::protocol::Reader;
using client3::protocol::Type;
using client3::protocol::Writer;

// The fields of each record that a reply fills, in declaration order, as OutputFields.h lists them.
template <class R>
inline constexpr auto FieldsOf = std::tuple<>{};
#define CLIENT3_MEMBER(type, name, ...) &Record::name,
#define CLIENT3_FIELDS(R)                                \
  template <>                                            \
  inline constexpr auto FieldsOf<R> = [] {               \
    using Record = R;                                    \
    return std::tuple{ZARVO_FIELDS_##R(CLIENT3_MEMBER)}; \
  }();
ZARVO_RESULT_RECORDS(CLIENT3_FIELDS)
ZARVO_SETTINGS_RECORDS(CLIENT3_FIELDS)
#undef CLIENT3_FIELDS
#undef CLIENT3_MEMBER

// ---- Types on the wire ------------------------------------------------------------------------

template <class T>
struct WireOf;
template <> struct WireOf<SafeString> { static constexpr Type value = Type::String; };
template <> struct WireOf<int> { static constexpr Type value = Type::Int; };
template <> struct WireOf<unsigned int> { static constexpr Type value = Type::UInt; };
template <> struct WireOf<unsigned long long> { static constexpr Type value = Type::ULong; };
template <> struct WireOf<bool> { static constexpr Type value = Type::Bool; };
template <> struct WireOf<float> { static constexpr Type value = Type::Float; };
template <> struct WireOf<double> { static constexpr Type value = Type::Double; };
template <> struct WireOf<std::vector<SafeString>> { static constexpr Type value = Type::Strings; };
template <> struct WireOf<std::vector<bool>> { static constexpr Type value = Type::Bools; };
template <> struct WireOf<std::vector<float>> { static constexpr Type value = Type::Floats; };
template <> struct WireOf<std::vector<double>> { static constexpr Type value = Type::Doubles; };
template <> struct WireOf<std::vector<int>> { static constexpr Type value = Type::Ints; };
template <> struct WireOf<std::vector<unsigned long long>> { static constexpr Type value = Type::ULongs; };
template <> struct WireOf<std::vector<Type_Parameter>> { static constexpr Type value = Type::Params; };

template <class M>
struct FieldType;
template <class C, class T>
struct FieldType<T C::*> : std::type_identity<T> {};

template <class Tuple, std::size_t... I>
constexpr bool FieldsMatch(std::span<const client3::protocol::Param> params, const Tuple&, std::index_sequence<I...>) {
  return params.size() == sizeof...(I) &&
         ((params[I].type == WireOf<typename FieldType<std::tuple_element_t<I, Tuple>>::type>::value) && ...);
}
// Whether a command's outputs are the fields of R, in order and type.
template <Id C, class R>
constexpr bool OutputsAre() {
  constexpr auto fields = FieldsOf<R>;
  return FieldsMatch(CommandOf(C).out, fields, std::make_index_sequence<std::tuple_size_v<decltype(fields)>>{});
}
template <Id C, class... A, std::size_t... I>
constexpr bool InputsAre(std::index_sequence<I...>) {
  return CommandOf(C).in.size() == sizeof...(A) && ((CommandOf(C).in[I].type == WireOf<A>::value) && ...);
}

// ---- Writing arguments ------------------------------------------------------------------------

inline void Put(Writer& w, SafeString const& text) { w.Put(text.Text()); }
inline void Put(Writer& w, int v) { w.Put(static_cast<std::int32_t>(v)); }
inline void Put(Writer& w, unsigned int v) { w.Put(static_cast<std::uint32_t>(v)); }
inline void Put(Writer& w, unsigned long long v) { w.Put(static_cast<std::uint64_t>(v)); }
inline void Put(Writer& w, bool v) { w.Put(v); }
inline void Put(Writer& w, float v) { w.Put(v); }
inline void Put(Writer& w, double v) { w.Put(v); }
inline void Put(Writer& w, std::vector<double> const& v) { w.Put(v); }
inline void Put(Writer& w, std::vector<bool> const& v) { w.Put(v); }
inline void Put(Writer& w, std::vector<Type_Parameter> const& v) {
  w.PutPairs(v, [](Type_Parameter const& p) {
    return std::pair<std::string_view, std::string_view>(p.Name.Text() ? p.Name.Text() : "", p.Value.Text() ? p.Value.Text() : "");
  });
}

// ---- Reading outputs --------------------------------------------------------------------------

// Thrown when a value that should be a number came as a text that is not one.
struct NotNumeric {};

// Gives `target` its own copy of `text`: one duplication, where assigning a new SafeString makes two.
inline void Own(SafeString& target, char const* text) {
  SafeString made(VStringFactory::Instance(), text);
  std::swap(target.OwnedText, made.OwnedText);
  std::swap(target.ViewText, made.ViewText);
  std::swap(target.Factory, made.Factory);
}
inline void Own(SafeString& target, std::string_view text) { Own(target, std::string(text).c_str()); }

// A number, also accepted as its text.
template <class T>
T Number(Reader& r) {
  if (r.Peek() != Type::String) {
    if constexpr (std::is_same_v<T, int>) return r.Get<std::int32_t>();
    else if constexpr (std::is_same_v<T, unsigned int>) return r.Get<std::uint32_t>();
    else if constexpr (std::is_same_v<T, unsigned long long>) return r.Get<std::uint64_t>();
    else return r.Get<T>();
  }
  std::string_view text = r.Text();
  T value{};
  if constexpr (std::is_same_v<T, bool>) {
    if (text == "true" || text == "1") return true;
    if (text == "false" || text == "0") return false;
    throw NotNumeric{};
  } else {
    auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size()) throw NotNumeric{};
    return value;
  }
}

template <class T>
void Read(Reader& r, T& out) {
  if constexpr (std::is_arithmetic_v<T>) {
    out = Number<T>(r);
  } else if constexpr (std::is_same_v<T, SafeString>) {
    Own(out, r.Text());
  } else if constexpr (std::is_same_v<T, std::vector<SafeString>>) {
    out.clear();
    r.GetTexts([&](std::string_view text) { Own(out.emplace_back(), text); });
  } else if constexpr (std::is_same_v<T, std::vector<Type_Parameter>>) {
    out.clear();
    r.GetPairs([&](std::string_view name, std::string_view value) {
      Type_Parameter& parameter = out.emplace_back();
      Own(parameter.Name, name);
      Own(parameter.Value, value);
    });
  } else if constexpr (std::is_same_v<T, std::vector<int>>) {
    std::vector<std::int32_t> values;
    r.Get(values);
    out.assign(values.begin(), values.end());
  } else if constexpr (std::is_same_v<T, std::vector<unsigned long long>>) {
    std::vector<std::uint64_t> values;
    r.Get(values);
    out.assign(values.begin(), values.end());
  } else {
    r.Get(out);
  }
}

// Reads every field of `record` that FieldsOf<R> lists.
template <class R>
void ReadFields(Reader& r, R& record) {
  std::apply([&](auto... field) { (Read(r, record.*field), ...); }, FieldsOf<R>);
  if (!r.done()) throw DecodeError("the reply has more values than the command gives");
}

// Sets the result code and its text: the application's message when it sent one (why it refused a
// command, or what a stage or filter did), else the code's own.
inline void SetResult(Output_Result& record, ResultCode::Enum code, std::string const& message) {
  record.Result = code;
  Own(record.ResultString, message.empty() ? ResultText(code) : message.c_str());
}

// Sends command C with `args` and reads the reply with `read(reader, record)` into a record R.
template <Id C, class R, class Read, class... A>
R Exchange(ClientConnection* connection, Read read, A const&... args) {
  static_assert(InputsAre<C, A...>(std::index_sequence_for<A...>{}), "the arguments are not the command's inputs");
  R record{};
  std::string message;
  ResultCode::Enum code = ResultCode::NotConnected;
  if (connection) {
    auto call = connection->Start(C);
    if (call.Begin()) {
      (Put(call.request(), args), ...);
      code = call.Exchange(message);
    }
    if (code == ResultCode::Success) {
      try {
        Reader outputs = call.outputs();
        read(outputs, record);
      } catch (const DecodeError&) {
        record = R{};
        code = ResultCode::ReplyParsingError;
        message.clear();
      } catch (const NotNumeric&) {
        record = R{};
        code = ResultCode::ConversionError;
        message.clear();
      }
    }
  }
  SetResult(record, code, message);
  return record;
}

// The common case: the command's outputs are the record's fields.
template <Id C, class R, class... A>
R Ask(ClientConnection* connection, A const&... args) {
  static_assert(OutputsAre<C, R>(), "the command's outputs are not the record's fields");
  return Exchange<C, R>(connection, [](Reader& r, R& record) { ReadFields(r, record); }, args...);
}

// A settings record sent as its fields, the command's inputs.
template <Id C, class R, class S>
R SendFields(ClientConnection* connection, S const& settings) {
  return std::apply([&](auto... field) { return Ask<C, R>(connection, settings.*field...); }, FieldsOf<S>);
}

// A member's request, shaped by what the member returns and takes: a record whose fields are the
// command's outputs; the one value a command gives (a number); whether a command without outputs
// succeeded (a bool); a settings record as its argument is sent field by field as the inputs.
template <Id C, class R, class... A>
R Call(ClientConnection* connection, A&... args) {
  if constexpr (sizeof...(A) == 1 && (std::is_base_of_v<Output_Result, A> && ...)) {
    return SendFields<C, R>(connection, args...);
  } else if constexpr (std::is_base_of_v<Output_Result, R>) {
    return Ask<C, R>(connection, args...);
  } else if constexpr (std::is_same_v<R, bool>) {
    static_assert(CommandOf(C).out.empty(), "a member that returns bool tells whether a command without outputs succeeded");
    return Ask<C, Output_Result>(connection, args...).Result == ResultCode::Success;
  } else {
    static_assert(CommandOf(C).out.size() == 1 && CommandOf(C).out[0].type == WireOf<R>::value,
                  "a member that returns a number returns its command's one output");
    R value{};
    Exchange<C, Output_Result>(connection, [&](Reader& r, Output_Result&) { Read(r, value); }, args...);
    return value;
  }
}

}  // namespace request

}  // namespace ZarvoSDKClientCPP
