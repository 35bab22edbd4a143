// This module's descriptor table, its cast lists and its record in the ring.
#include "types/types.h"

namespace client3 {

namespace {

TypeInfo descriptors[TypeCount] = {
#define CLIENT3_DESCRIPTOR(id, mangled, pretty) {mangled, pretty, nullptr, nullptr, nullptr, 0},
    CLIENT3_TYPES(CLIENT3_DESCRIPTOR)
#undef CLIENT3_DESCRIPTOR
};

// Up-casts from a derived type: the address is unchanged for single inheritance, but each source
// keeps a converter of its own, so that a registration does not spread to derived types.
template <class From, class To>
void* UpCast(void* pointer, int*) {
  return static_cast<To*>(static_cast<From*>(pointer));
}

template <TypeId Id>
CastInfo selfCasts[] = {{&descriptors[Id], nullptr, nullptr, nullptr}, {nullptr, nullptr, nullptr, nullptr}};

using namespace ZarvoSDKClientCPP;

CastInfo outputResultCasts[] = {
    {&descriptors[p_Output_Result], nullptr, nullptr, nullptr},
#define CLIENT3_RECORD_CAST(name) {&descriptors[p_##name], UpCast<name, Output_Result>, nullptr, nullptr},
    CLIENT3_DERIVED_RECORDS(CLIENT3_RECORD_CAST)
#undef CLIENT3_RECORD_CAST
    {nullptr, nullptr, nullptr, nullptr},
};

CastInfo clientCasts[] = {
    {&descriptors[p_ZarvoClient], nullptr, nullptr, nullptr},
    {&descriptors[p_ZarvoPelluxPostClient], UpCast<ZarvoPelluxPostClient, ZarvoClient>, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr},
};

CastInfo factoryCasts[] = {
    {&descriptors[p_IStringFactory], nullptr, nullptr, nullptr},
    {&descriptors[p_VStringFactory], UpCast<VStringFactory, IStringFactory>, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr},
};

constexpr CastInfo* CastsOf(TypeId id, CastInfo* self) {
  return id == p_Output_Result ? outputResultCasts
         : id == p_ZarvoClient ? clientCasts
         : id == p_IStringFactory ? factoryCasts
                                  : self;
}

TypeInfo* typeInitial[TypeCount] = {
#define CLIENT3_INITIAL(id, mangled, pretty) &descriptors[id],
    CLIENT3_TYPES(CLIENT3_INITIAL)
#undef CLIENT3_INITIAL
};

CastInfo* castInitial[TypeCount] = {
#define CLIENT3_CASTS(id, mangled, pretty) CastsOf(id, selfCasts<id>),
    CLIENT3_TYPES(CLIENT3_CASTS)
#undef CLIENT3_CASTS
};

TypeInfo* types[TypeCount + 1];

}  // namespace

ModuleInfo thisModule = {types, TypeCount, nullptr, typeInitial, castInitial, nullptr};

}  // namespace client3
