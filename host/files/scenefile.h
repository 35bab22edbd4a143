// The scene file: a text file, one record a line, that holds everything of a scene (see the
// reference page for its format).
#pragma once

#include <string>
#include <string_view>

#include "host/scene/scene.h"

namespace client3::host {

std::string WriteScene(Scene& scene);
// The scene that `text` describes, with new ids; refuses (Failure) a text that is not a whole and
// valid scene file.
Scene ReadScene(std::string_view text);
// The scene of the file at `path` (UTF-8), refused (Failure) when it cannot be read or is damaged.
Scene LoadScene(const std::string& path);

}  // namespace client3::host
