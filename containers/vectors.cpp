// The six vector types and their iterators.
#include "runtime/module.h"
#include "runtime/wrap.h"

namespace client3 {

std::span<const PyMethodDef> IteratorFunctions() { return {}; }
std::span<const PyMethodDef> VectorFunctions() { return {}; }

}  // namespace client3
