// The client's operations. Each is one request to the application (the command of the same name),
// except the connection's own and AllocSafeString, which the library answers itself. The requests'
// definitions are made from the catalogue, one per command, with the parameter and result types of
// the member's declaration; request::Call shapes each by those types, and the two truly special
// requests are specialisations of it.
#include <algorithm>
#include <cstddef>
#include <string>
#include <tuple>
#include <type_traits>

#include "library/Connection.h"
#include "library/Request.h"

namespace ZarvoSDKClientCPP {

using C = ZarvoPelluxPostClient;
using client3::protocol::Id;
using client3::protocol::Reader;
using request::Exchange;

namespace {

// The result and parameter types of a member of the client.
template <class F>
struct Signature;
template <class R, class... A>
struct Signature<R (C::*)(A...)> {
  using Result = R;
  using Args = std::tuple<A...>;
};
template <auto F>
using Result = typename Signature<decltype(F)>::Result;
template <auto F, std::size_t I>
using Arg = std::tuple_element_t<I, typename Signature<decltype(F)>::Args>;

}  // namespace

C::ZarvoPelluxPostClient() : m_Connection(new ClientConnection) {}
C::~ZarvoPelluxPostClient() { delete m_Connection; }

Output_Result C::Connect(SafeString const& address, int port) {
  Output_Result result{};
  std::string message;
  ResultCode::Enum code = m_Connection->Open(address, port, message);
  request::SetResult(result, code, message);
  return result;
}

void C::Disconnect() { m_Connection->Close(); }

bool C::IsConnected() const { return m_Connection->Connected(); }

SafeString C::AllocSafeString(SafeString const& text) {
  return SafeString(VStringFactory::Instance(), text.Text() ? text.Text() : "");
}

// The parameters are sent as they are; the reply's list of every parameter as used (the inputs,
// defaults filled in, then the outputs) replaces them, and the outputs alone go into the record.
template <>
Output_ProcessRequest request::Call<Id::ProcessRequest, Output_ProcessRequest>(
    ClientConnection* connection, SafeString const& command, std::vector<Type_Parameter>& parameters) {
  std::vector<Type_Parameter> used;
  auto result = Exchange<Id::ProcessRequest, Output_ProcessRequest>(
      connection,
      [&](Reader& r, Output_ProcessRequest& record) {
        request::Read(r, used);
        request::ReadFields(r, record);
      },
      command, parameters);
  if (result.Result == ResultCode::Success) parameters = std::move(used);
  return result;
}

// The reply carries the frame as arrays of one element each; any other length is refused.
template <>
Output_GetTrajectoryAtFrame request::Call<Id::GetTrajectoryAtFrame, Output_GetTrajectoryAtFrame>(
    ClientConnection* connection, SafeString const& subject, SafeString const& marker, int& frame) {
  static_assert(request::OutputsAre<Id::GetTrajectoryAtFrame, Output_GetTrajectory>());
  bool oneFrame = true;
  auto result = Exchange<Id::GetTrajectoryAtFrame, Output_GetTrajectoryAtFrame>(
      connection,
      [&](Reader& r, Output_GetTrajectoryAtFrame& record) {
        Output_GetTrajectory frames{};
        request::ReadFields(r, frames);
        oneFrame = frames.X.size() == 1 && frames.Y.size() == 1 && frames.Z.size() == 1 && frames.E.size() == 1;
        if (!oneFrame) return;
        record.X = frames.X[0], record.Y = frames.Y[0], record.Z = frames.Z[0], record.E = frames.E[0];
      },
      subject, marker, frame);
  if (!oneFrame) request::SetResult(result, ResultCode::ExpectedOneFrame, std::string());
  return result;
}

// A command's inputs counted (up to eight), and as many parameters a0, a1, ... typed from the member.
#define CLIENT3_COUNT(...) CLIENT3_COUNT_(__VA_ARGS__ __VA_OPT__(, ) 8, 7, 6, 5, 4, 3, 2, 1, 0)
#define CLIENT3_COUNT_(_1, _2, _3, _4, _5, _6, _7, _8, n, ...) n
#define CLIENT3_CAT(a, b) CLIENT3_CAT_(a, b)
#define CLIENT3_CAT_(a, b) a##b
#define CLIENT3_PARAMS_0(f)
#define CLIENT3_PARAMS_1(f) Arg<f, 0> a0
#define CLIENT3_PARAMS_2(f) CLIENT3_PARAMS_1(f), Arg<f, 1> a1
#define CLIENT3_PARAMS_3(f) CLIENT3_PARAMS_2(f), Arg<f, 2> a2
#define CLIENT3_PARAMS_4(f) CLIENT3_PARAMS_3(f), Arg<f, 3> a3
#define CLIENT3_PARAMS_5(f) CLIENT3_PARAMS_4(f), Arg<f, 4> a4
#define CLIENT3_PARAMS_6(f) CLIENT3_PARAMS_5(f), Arg<f, 5> a5
#define CLIENT3_PARAMS_7(f) CLIENT3_PARAMS_6(f), Arg<f, 6> a6
#define CLIENT3_PARAMS_8(f) CLIENT3_PARAMS_7(f), Arg<f, 7> a7
#define CLIENT3_ARGS_0
#define CLIENT3_ARGS_1 , a0
#define CLIENT3_ARGS_2 CLIENT3_ARGS_1, a1
#define CLIENT3_ARGS_3 CLIENT3_ARGS_2, a2
#define CLIENT3_ARGS_4 CLIENT3_ARGS_3, a3
#define CLIENT3_ARGS_5 CLIENT3_ARGS_4, a4
#define CLIENT3_ARGS_6 CLIENT3_ARGS_5, a5
#define CLIENT3_ARGS_7 CLIENT3_ARGS_6, a6
#define CLIENT3_ARGS_8 CLIENT3_ARGS_7, a7

// Every member that is a command. The header's declaration must return the catalogue's result and
// take parameters of the inputs' types, or this does not build.
#define CLIENT3_DEFINE(name, result, description, in, out)                                             \
  static_assert(std::is_same_v<Result<&C::name>, result>, #name " returns the catalogue's result");    \
  Result<&C::name> C::name(CLIENT3_CAT(CLIENT3_PARAMS_, CLIENT3_COUNT in)(&C::name)) {                 \
    return request::Call<Id::name, result>(m_Connection CLIENT3_CAT(CLIENT3_ARGS_, CLIENT3_COUNT in)); \
  }
CLIENT3_CLIENT_COMMANDS(CLIENT3_DEFINE)

}  // namespace ZarvoSDKClientCPP
