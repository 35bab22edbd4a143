// The client facade's module functions.
#include "runtime/module.h"
#include "runtime/wrap.h"

namespace client3 {

namespace {

using Functions = Table<
    Register<"ZarvoPelluxPostClient", p_ZarvoPelluxPostClient>,
    Init<"ZarvoPelluxPostClient">>;

}  // namespace

std::span<const PyMethodDef> ClientFunctions() { return Functions::defs; }

}  // namespace client3
