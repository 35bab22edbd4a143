// The client facade's module functions.
#include "runtime/module.h"
#include "runtime/wrap.h"

namespace client3 {

std::span<const PyMethodDef> ClientFunctions() { return {}; }

}  // namespace client3
