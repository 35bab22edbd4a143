// Type_Parameter and the Output_* records.
#include "runtime/module.h"
#include "runtime/wrap.h"

namespace client3 {

std::span<const PyMethodDef> RecordFunctions() { return {}; }

}  // namespace client3
