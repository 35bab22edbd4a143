// Scenes and files: a new scene, loading and saving scene files.
#include "host/access.h"
#include "host/handlers.h"
#include "host/scenefile.h"
#include "platform/files.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

// The largest scene file the application reads.
constexpr std::uintmax_t kMaxSceneFile = std::uintmax_t{2} << 30;

void NewScene(Context& context, Reader&, Writer&) { context.scene = EmptyScene(context.scene.frames); }

void LoadFile(Context& context, Reader& in, Writer&) {
  std::string path(in.Text());
  if (path.empty()) Refuse("a file path cannot be empty");
  context.scene = LoadScene(FilePlace(path));
  context.scene.path = path;
}

void SaveFile(Context& context, Reader& in, Writer&) {
  std::string path(in.Text());
  std::string_view options = in.Text();
  if (path.empty()) Refuse("a file path cannot be empty");
  if (!options.empty()) Refuse("'SaveFile' takes no options: '" + std::string(options) + "'");
  if (!platform::WriteFileAtomically(FilePlace(path), WriteScene(context.scene))) Refuse("cannot write the file '" + path + "'");
  context.scene.path = path;
}

constexpr HandlerEntry kHandlers[] = {
    {Id::NewScene, &NewScene},
    {Id::LoadFile, &LoadFile},
    {Id::SaveFile, &SaveFile},
};

}  // namespace

Scene LoadScene(const std::string& path) {
  std::string text;
  if (!platform::ReadFile(path, text, kMaxSceneFile)) Refuse("cannot read the file '" + path + "'");
  Scene scene = ReadScene(text);
  scene.path = path;
  return scene;
}

std::span<const HandlerEntry> FileHandlers() { return kHandlers; }

}  // namespace client3::host
