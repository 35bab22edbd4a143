// Type_Parameter and the Output_* records: each record's fields (as the library's OutputFields.h
// describes them) and then its member functions.
#include "records/record.h"

namespace client3 {

namespace {

using namespace ZarvoSDKClientCPP;
using namespace record;

// Each record's fields as table lines, in the order OutputFields.h lists them: As<Kind, Methods...> is
// Kind<X, Field<...>..., Methods...>.
template <class X>
struct Described;
#define CLIENT3_FIELD(type, name, ...) , Field<#name, &X::name>
#define CLIENT3_DESCRIBED(R)                                        \
  template <>                                                       \
  struct Described<R> {                                             \
    using X = R;                                                    \
    template <template <class...> class Kind, class... Methods>     \
    using As = Kind<R ZARVO_FIELDS_##R(CLIENT3_FIELD), Methods...>; \
  };
CLIENT3_DESCRIBED(Type_Parameter)
CLIENT3_DESCRIBED(Output_Result)
ZARVO_RESULT_RECORDS(CLIENT3_DESCRIBED)
ZARVO_SETTINGS_RECORDS(CLIENT3_DESCRIBED)
#undef CLIENT3_DESCRIBED
#undef CLIENT3_FIELD

#define CLIENT3_RECORD(R) , Described<R>::As<Record>
#define CLIENT3_CREATABLE(R) , Described<R>::As<Creatable>
using Functions = Table<
    Described<Type_Parameter>::As<Creatable>,
    // The protocol records.
    Described<Output_Result>::As<Record, Method<"Error", &Output_Result::Error>>
    ZARVO_PROTOCOL_RECORDS(CLIENT3_RECORD),
    Described<Output_GetCommandInfo>::As<Record, Method<"DefaultOutputString", &Output_GetCommandInfo::DefaultOutputString>>
    // The query results.
    ZARVO_QUERY_RECORDS(CLIENT3_RECORD)
    // The processing settings, which scripts also create.
    ZARVO_SETTINGS_RECORDS(CLIENT3_CREATABLE)>;
#undef CLIENT3_RECORD
#undef CLIENT3_CREATABLE

}  // namespace

std::span<const PyMethodDef> RecordFunctions() { return Functions::defs; }

}  // namespace client3
