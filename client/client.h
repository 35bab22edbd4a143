// The client facade's module functions (client.cpp).
#pragma once

#include <span>

#include "runtime/runtime.h"

namespace client3 {

std::span<const PyMethodDef> ClientFunctions();

}  // namespace client3
