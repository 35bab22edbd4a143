// The handlers of scenes and files: a new scene, scene files, and importing and exporting takes.
#include "host/commands/command.h"
#include "host/commands/lookups.h"
#include "host/files/access.h"
#include "host/files/interchange.h"
#include "host/files/scenefile.h"
#include "platform/files.h"

namespace client3::host {

namespace {

std::string PathOf(protocol::Reader& in) {
  std::string path(in.Text());
  if (path.empty()) Refuse("a file path cannot be empty");
  return path;
}

}  // namespace

CLIENT3_HANDLER(NewScene, Write) { context.scene = EmptyScene(context.scene.frames); }

CLIENT3_HANDLER(LoadFile, Write) {
  std::string path = PathOf(in);
  context.scene = LoadScene(FilePlace(path));
  context.scene.path = path;
}

CLIENT3_HANDLER(SaveFile, Write) {
  std::string path = PathOf(in);
  NoOptions("SaveFile", in.Text());
  if (!platform::WriteFileAtomically(FilePlace(path), WriteScene(context.scene))) Refuse("cannot write the file '" + path + "'");
  context.scene.path = path;
}

// Merge true writes the file's markers into the scene, false replaces the scene with a new one
// holding the file's subjects and markers.
CLIENT3_HANDLER(ImportFile, Write) {
  std::string path = PathOf(in);
  std::string_view format = in.Text();
  context.scene = Imported(context.scene, path, format, in.Get<bool>());
}

CLIENT3_HANDLER(ExportFile, Write) {
  std::string path = PathOf(in);
  Export(context.scene, path, in.Text());
}

}  // namespace client3::host
