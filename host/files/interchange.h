// Importing and exporting takes: CSV text (one row per frame, markers only) and C3D files (markers,
// analog channels and the groups of a C3D file that the application does not use).
#pragma once

#include <string>
#include <string_view>

#include "host/scene/scene.h"

namespace client3::host {

// The scene with the file at `path` imported as `format` ("csv" or "c3d" in any case; empty: the
// path's extension): with `merge`, `scene` with the file's markers written into it; without, a new
// scene of the file's subjects and markers named after the file. A damaged file is refused.
Scene Imported(const Scene& scene, const std::string& path, std::string_view format, bool merge);

// Writes the scene's markers (to a C3D file also its analog channels and kept groups) to `path`.
void Export(Scene& scene, const std::string& path, std::string_view format);

}  // namespace client3::host
