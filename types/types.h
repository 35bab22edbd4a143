// The native types that cross into scripts: one descriptor each, sorted by mangled name (the lookup
// by mangled name is a binary search), with the readable spellings whose last one is shown; the
// descriptor of each C++ type that the wrappers convert, and the spelling of each class in messages.
#pragma once

#include <memory>
#include <stdexcept>
#include <vector>

#include "runtime/runtime.h"
#include "runtime/text.h"
#include "ZarvoSDKClientCPP/Outputs.h"
#include "ZarvoSDKClientCPP/ZarvoPelluxPostClient.h"

namespace swig {
class SwigPyIterator;
}

namespace client3 {

// X(identifier, mangled name, readable names). Most classes of the library are named alike; the ones
// only known as sources of a cast have no readable name.
#define CLIENT3_CLASS(X, name) X(p_##name, "_p_ZarvoSDKClientCPP__" #name, "ZarvoSDKClientCPP::" #name " *")
#define CLIENT3_UNNAMED_CLASS(X, name) X(p_##name, "_p_ZarvoSDKClientCPP__" #name, nullptr)
#define CLIENT3_TYPES(X) \
  CLIENT3_CLASS(X, IStringFactory) \
  CLIENT3_CLASS(X, Output_CircleFitSettings) \
  CLIENT3_CLASS(X, Output_GetAttribute) \
  CLIENT3_CLASS(X, Output_GetBoneDetails) \
  CLIENT3_CLASS(X, Output_GetBoneNames) \
  CLIENT3_CLASS(X, Output_GetCommandInfo) \
  CLIENT3_CLASS(X, Output_GetCommandList) \
  CLIENT3_CLASS(X, Output_GetConstraintDetails) \
  CLIENT3_CLASS(X, Output_GetConstraintNames) \
  CLIENT3_CLASS(X, Output_GetFloat) \
  CLIENT3_CLASS(X, Output_GetInteger) \
  CLIENT3_CLASS(X, Output_GetIntegerList) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetJointDetails) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetJointNames) \
  CLIENT3_CLASS(X, Output_GetMarkerNames) \
  CLIENT3_CLASS(X, Output_GetObject) \
  CLIENT3_CLASS(X, Output_GetObjectList) \
  CLIENT3_CLASS(X, Output_GetRootBone) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetRootSegment) \
  CLIENT3_CLASS(X, Output_GetSceneName) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetSegmentDetails) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetSegmentNames) \
  CLIENT3_CLASS(X, Output_GetServerInfo) \
  CLIENT3_CLASS(X, Output_GetString) \
  CLIENT3_CLASS(X, Output_GetStringList) \
  CLIENT3_CLASS(X, Output_GetSubjectNames) \
  CLIENT3_CLASS(X, Output_GetSubjectParamDetails) \
  CLIENT3_CLASS(X, Output_GetSubjectParamNames) \
  CLIENT3_CLASS(X, Output_GetTakeInfo) \
  CLIENT3_CLASS(X, Output_GetTrajectory) \
  CLIENT3_CLASS(X, Output_GetTrajectoryAtFrame) \
  CLIENT3_UNNAMED_CLASS(X, Output_GetTrialName) \
  CLIENT3_CLASS(X, Output_GetUnsignedLong) \
  CLIENT3_CLASS(X, Output_GetUnsignedLongList) \
  CLIENT3_CLASS(X, Output_HasTrajectory) \
  CLIENT3_CLASS(X, Output_LabelROMSettings) \
  CLIENT3_CLASS(X, Output_LabelingSettings) \
  CLIENT3_CLASS(X, Output_LabelingSubjectCalibrationSettings) \
  CLIENT3_CLASS(X, Output_OcclusionFixingSettings) \
  CLIENT3_CLASS(X, Output_ProcessRequest) \
  CLIENT3_CLASS(X, Output_ReconstructSettings) \
  CLIENT3_CLASS(X, Output_Result) \
  CLIENT3_CLASS(X, Output_SolvingSettings) \
  X(p_SafeString, "_p_ZarvoSDKClientCPP__SafeString", "ZarvoSDKClientCPP::SafeString *|std::vector< ZarvoSDKClientCPP::SafeString >::value_type *") \
  CLIENT3_CLASS(X, Type_Parameter) \
  CLIENT3_UNNAMED_CLASS(X, VStringFactory) \
  CLIENT3_CLASS(X, ZarvoClient) \
  CLIENT3_CLASS(X, ZarvoPelluxPostClient) \
  X(p_int64, "_p___int64", "LONGLONG *|LONG64 *|INT64 *|__int64 *") \
  X(p_allocator_type, "_p_allocator_type", "allocator_type *") \
  X(p_char, "_p_char", "char *") \
  X(p_const_reference, "_p_const_reference", "const_reference *") \
  X(p_difference_type, "_p_difference_type", "difference_type *") \
  X(p_float, "_p_float", "FLOAT *|float *") \
  X(p_int, "_p_int", "BOOL *|INT32 *|int *|INT *|INT_PTR *|LONG32 *") \
  X(p_long, "_p_long", "LONG *|long *") \
  X(p_p_PyObject, "_p_p_PyObject", "PyObject **") \
  X(p_p_char, "_p_p_char", "char **") \
  X(p_p_unsigned_long, "_p_p_unsigned_long", "unsigned long **|DWORD **|ULONG **") \
  X(p_short, "_p_short", "INT16 *|SHORT *|short *") \
  X(p_signed___int64, "_p_signed___int64", "signed __int64 *") \
  X(p_signed_char, "_p_signed_char", "INT8 *|signed char *") \
  X(p_size_type, "_p_size_type", "size_type *") \
  X(p_Allocator_SafeString, "_p_std__allocatorT_ZarvoSDKClientCPP__SafeString_t", "std::vector< ZarvoSDKClientCPP::SafeString >::allocator_type *|std::allocator< ZarvoSDKClientCPP::SafeString > *") \
  X(p_Allocator_bool, "_p_std__allocatorT_bool_t", "std::vector< bool >::allocator_type *|std::allocator< bool > *") \
  X(p_Allocator_double, "_p_std__allocatorT_double_t", "std::vector< double >::allocator_type *|std::allocator< double > *") \
  X(p_Allocator_float, "_p_std__allocatorT_float_t", "std::vector< float >::allocator_type *|std::allocator< float > *") \
  X(p_Allocator_int, "_p_std__allocatorT_int_t", "std::vector< int >::allocator_type *|std::allocator< int > *") \
  X(p_Allocator_unsigned_long_long, "_p_std__allocatorT_unsigned_long_long_t", "std::vector< unsigned long long >::allocator_type *|std::allocator< unsigned long long > *") \
  X(p_std_invalid_argument, "_p_std__invalid_argument", "std::invalid_argument *") \
  X(p_Vector_SafeString, "_p_std__vectorT_ZarvoSDKClientCPP__SafeString_std__allocatorT_ZarvoSDKClientCPP__SafeString_t_t", "std::vector< ZarvoSDKClientCPP::SafeString > *|std::vector< ZarvoSDKClientCPP::SafeString,std::allocator< ZarvoSDKClientCPP::SafeString > > *") \
  X(p_Vector_Type_Parameter, "_p_std__vectorT_ZarvoSDKClientCPP__Type_Parameter_std__allocatorT_ZarvoSDKClientCPP__Type_Parameter_t_t", "std::vector< ZarvoSDKClientCPP::Type_Parameter,std::allocator< ZarvoSDKClientCPP::Type_Parameter > > *") \
  X(p_Vector_bool, "_p_std__vectorT_bool_std__allocatorT_bool_t_t", "std::vector< bool,std::allocator< bool > > *|std::vector< bool > *") \
  X(p_Vector_double, "_p_std__vectorT_double_std__allocatorT_double_t_t", "std::vector< double,std::allocator< double > > *|std::vector< double > *") \
  X(p_Vector_float, "_p_std__vectorT_float_std__allocatorT_float_t_t", "std::vector< float > *|std::vector< float,std::allocator< float > > *") \
  X(p_Vector_int, "_p_std__vectorT_int_std__allocatorT_int_t_t", "std::vector< int,std::allocator< int > > *|std::vector< int > *") \
  X(p_Vector_unsigned_long_long, "_p_std__vectorT_unsigned_long_long_std__allocatorT_unsigned_long_long_t_t", "std::vector< unsigned long long > *|std::vector< unsigned long long,std::allocator< unsigned long long > > *") \
  X(p_SwigPyIterator, "_p_swig__SwigPyIterator", "swig::SwigPyIterator *") \
  X(p_unsigned___int64, "_p_unsigned___int64", "ULONGLONG *|DWORD64 *|UINT64 *|unsigned __int64 *") \
  X(p_unsigned_char, "_p_unsigned_char", "UCHAR *|BYTE *|UINT8 *|unsigned char *") \
  X(p_unsigned_int, "_p_unsigned_int", "DWORD32 *|UINT *|UINT32 *|unsigned int *") \
  X(p_unsigned_long, "_p_unsigned_long", "DWORD *|ULONG *|unsigned long *") \
  X(p_unsigned_short, "_p_unsigned_short", "WORD *|USHORT *|UINT16 *|unsigned short *") \
  X(p_value_type, "_p_value_type", "value_type *")

enum TypeId : int {
#define CLIENT3_TYPE_ID(id, mangled, pretty) id,
  CLIENT3_TYPES(CLIENT3_TYPE_ID)
#undef CLIENT3_TYPE_ID
  TypeCount
};

#define CLIENT3_TYPE_OF(cxx, id) \
  template <>                    \
  inline constexpr int TypeOf<cxx> = id;
#define CLIENT3_RECORD_TYPE(name) CLIENT3_TYPE_OF(ZarvoSDKClientCPP::name, p_##name)
// Every record derived from Output_Result.
#define CLIENT3_DERIVED_RECORDS(X) ZARVO_RESULT_RECORDS(X) ZARVO_LEGACY_RECORDS(X) ZARVO_SETTINGS_RECORDS(X)
CLIENT3_DERIVED_RECORDS(CLIENT3_RECORD_TYPE)
CLIENT3_RECORD_TYPE(Output_Result)
CLIENT3_RECORD_TYPE(SafeString)
CLIENT3_RECORD_TYPE(Type_Parameter)
CLIENT3_RECORD_TYPE(IStringFactory)
CLIENT3_RECORD_TYPE(VStringFactory)
CLIENT3_RECORD_TYPE(ZarvoClient)
CLIENT3_RECORD_TYPE(ZarvoPelluxPostClient)
CLIENT3_TYPE_OF(swig::SwigPyIterator, p_SwigPyIterator)
// The six element types with a vector class: the vector and its allocator.
#define CLIENT3_CONTAINER_TYPES(element, id)                 \
  CLIENT3_TYPE_OF(std::vector<element>, p_Vector_##id)       \
  CLIENT3_TYPE_OF(std::allocator<element>, p_Allocator_##id)
CLIENT3_CONTAINER_TYPES(bool, bool)
CLIENT3_CONTAINER_TYPES(double, double)
CLIENT3_CONTAINER_TYPES(float, float)
CLIENT3_CONTAINER_TYPES(int, int)
CLIENT3_CONTAINER_TYPES(unsigned long long, unsigned_long_long)
CLIENT3_CONTAINER_TYPES(ZarvoSDKClientCPP::SafeString, SafeString)
#undef CLIENT3_CONTAINER_TYPES
CLIENT3_TYPE_OF(std::vector<ZarvoSDKClientCPP::Type_Parameter>, p_Vector_Type_Parameter)
CLIENT3_TYPE_OF(std::invalid_argument, p_std_invalid_argument)
CLIENT3_TYPE_OF(char, p_char)
#undef CLIENT3_RECORD_TYPE
#undef CLIENT3_TYPE_OF

// The qualified C++ spelling of each wrapped class, as the messages name it.
#define CLIENT3_NAME_OF(name) \
  template <>                 \
  inline constexpr auto NameOf<ZarvoSDKClientCPP::name> = Text{"ZarvoSDKClientCPP::" #name};
CLIENT3_DERIVED_RECORDS(CLIENT3_NAME_OF)
CLIENT3_NAME_OF(Output_Result)
CLIENT3_NAME_OF(SafeString)
CLIENT3_NAME_OF(Type_Parameter)
CLIENT3_NAME_OF(ZarvoPelluxPostClient)
#undef CLIENT3_NAME_OF
template <>
inline constexpr auto NameOf<swig::SwigPyIterator> = Text{"swig::SwigPyIterator"};

}  // namespace client3
