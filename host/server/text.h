// The text forms of values, for the commands that take and give their parameters as text (the
// generic request and the command line). Numbers are written in their shortest exact form; the
// elements of a list are separated by commas, and a comma or backslash inside a text element is
// written behind a backslash.
#pragma once

#include <string>
#include <string_view>

#include "protocol/wire.h"

namespace client3::host {

// Reads the next value of type `type` and writes it as text.
std::string ToText(protocol::Reader& in, protocol::Type type);

// Writes `text` as a value of type `type`; false when the text is not such a value.
bool FromText(std::string_view text, protocol::Type type, protocol::Writer& out);

// The name of a type as command descriptions show it ("int", "double list", ...).
std::string_view TypeName(protocol::Type type);

}  // namespace client3::host
