// The families of module functions, in the order the module lists them.
#pragma once

#include <span>

#include "runtime/runtime.h"

namespace client3 {

std::span<const PyMethodDef> IteratorFunctions();
std::span<const PyMethodDef> VectorFunctions();
std::span<const PyMethodDef> SafeStringFunctions();
std::span<const PyMethodDef> RecordFunctions();
std::span<const PyMethodDef> ClientFunctions();

}  // namespace client3
