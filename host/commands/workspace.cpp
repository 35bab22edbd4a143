// The handlers of the application's workspace outside the scene: the script search path and the
// capture database. Both outlive a new or loaded scene. The scene lock guards them too: the commands
// that change them hold it alone, and those that only read them share it.
//
// A capture database is a directory holding the file `client3.database`; its sessions are the
// directories inside it, and a session's takes the directories inside the session. A take is marked
// when its directory holds a file named `marked`. Names inside a database are single path
// components: `..`, separators and links are refused, so that nothing reaches outside it.
#include <algorithm>

#include "host/commands/command.h"
#include "host/files/access.h"
#include "host/server/log.h"
#include "platform/files.h"

namespace client3::host {

using platform::FileKind;

namespace {

constexpr const char* kDatabaseFile = "client3.database";
constexpr const char* kDatabaseText = "client3-database 1\n";
constexpr const char* kFirstSession = "Session 1";
constexpr const char* kMarkFile = "marked";
constexpr const char* kScriptExtension = ".py";

struct ScriptDirectory {
  std::string given;  // as the user wrote it
  std::string full;   // absolute, links resolved, when it was added
};

struct Workspace {
  std::vector<ScriptDirectory> scriptPath;
  std::string database;  // absolute path of the current database; empty when there is none
  std::string session;   // the current session's name inside it
  std::string take;      // the current take's name inside the session
};

Workspace& State() {
  static Workspace workspace;
  return workspace;
}

std::string Join(const std::string& directory, std::string_view name) {
  std::string path = directory;
  if (path.empty() || (path.back() != '/' && path.back() != platform::kSeparator)) path += platform::kSeparator;
  return path + std::string(name);
}

// The absolute form of an existing directory named by the user; refused when there is none.
std::string ExistingDirectory(const std::string& path) {
  if (path.empty()) Refuse("a directory path cannot be empty");
  std::string full = platform::FullPath(FilePlace(path));
  if (full.empty() || platform::KindOf(full) != FileKind::Directory) Refuse("no directory at '" + path + "'");
  return full;
}

// The script files of a directory, by name; nothing when it cannot be read.
std::optional<std::vector<std::string>> ScriptsIn(const std::string& directory) {
  std::vector<platform::DirectoryEntry> entries;
  if (!platform::ListDirectory(directory, entries)) return std::nullopt;
  std::vector<std::string> scripts;
  std::string_view extension = kScriptExtension;
  for (const auto& entry : entries)
    if (entry.kind == FileKind::File && entry.name.size() > extension.size() && entry.name.ends_with(extension))
      scripts.push_back(entry.name);
  return scripts;
}

void LogScripts(const std::string& directory, const std::vector<std::string>& scripts) {
  std::string list;
  for (const std::string& name : scripts) list += (list.empty() ? "" : ", ") + name;
  LogLine("info", "script path: " + std::to_string(scripts.size()) + " scripts in '" + directory + "'" +
                      (list.empty() ? "" : ": " + list));
}

// Refuses a name that is not one plain path component.
void CheckComponent(std::string_view name, std::string_view what) {
  std::string why;
  if (name.empty()) why = "it is empty";
  else if (name == "." || name == "..") why = "it climbs out of its directory";
  else if (name.find_first_of("/\\:") != std::string_view::npos) why = "it holds a '/', '\\' or ':'";
  else if (std::any_of(name.begin(), name.end(), [](char c) { return static_cast<unsigned char>(c) < 0x20; }))
    why = "it holds a control character";
  if (!why.empty()) Refuse("'" + std::string(name) + "' cannot name a " + std::string(what) + ": " + why);
}

bool IsDatabase(const std::string& directory) {
  return platform::KindOf(directory) == FileKind::Directory && platform::KindOf(Join(directory, kDatabaseFile)) == FileKind::File;
}

const std::string& CurrentDatabase() {
  const std::string& database = State().database;
  if (database.empty()) Refuse("there is no current database");
  if (!IsDatabase(database)) Refuse("the current database '" + database + "' is gone");
  return database;
}

// A directory inside `parent` named by one component; links and anything else are refused.
std::string Inside(const std::string& parent, std::string_view name, std::string_view what) {
  CheckComponent(name, what);
  std::string path = Join(parent, name);
  switch (platform::KindOf(path)) {
    case FileKind::Directory: return path;
    case FileKind::Link: Refuse("the " + std::string(what) + " '" + std::string(name) + "' is a link: a database may not lead outside itself");
    case FileKind::Missing: Refuse("there is no " + std::string(what) + " '" + std::string(name) + "'");
    default: Refuse("the " + std::string(what) + " '" + std::string(name) + "' is not a directory");
  }
}

// The directories inside `directory`, links left out.
std::vector<std::string> Subdirectories(const std::string& directory) {
  std::vector<platform::DirectoryEntry> entries;
  std::vector<std::string> names;
  if (!platform::ListDirectory(directory, entries)) return names;
  for (const auto& entry : entries)
    if (entry.kind == FileKind::Directory) names.push_back(entry.name);
  return names;
}

}  // namespace

// ---- Script paths ---------------------------------------------------------------------------------

CLIENT3_HANDLER(AddScriptPath, Write) {
  std::string path(in.Text());
  std::string full = ExistingDirectory(path);
  auto& list = State().scriptPath;
  if (std::any_of(list.begin(), list.end(), [&](const ScriptDirectory& d) { return d.full == full; })) return;
  auto scripts = ScriptsIn(full);
  if (!scripts) Refuse("cannot read the directory '" + path + "'");
  list.push_back({path, full});
  LogScripts(full, *scripts);
}

CLIENT3_HANDLER(RemoveScriptPath, Write) {
  std::string path(in.Text());
  std::string full = platform::FullPath(path);
  auto& list = State().scriptPath;
  auto found = std::find_if(list.begin(), list.end(), [&](const ScriptDirectory& d) {
    return d.given == path || (!full.empty() && d.full == full);
  });
  if (found == list.end()) Refuse("'" + path + "' is not on the script path");
  list.erase(found);
}

CLIENT3_HANDLER(ReparseScriptPaths, Write) {
  std::vector<std::vector<std::string>> found;
  for (const ScriptDirectory& d : State().scriptPath) {
    auto scripts = platform::KindOf(d.full) == FileKind::Directory ? ScriptsIn(d.full) : std::nullopt;
    if (!scripts) Refuse("the script directory '" + d.given + "' cannot be read any more");
    found.push_back(std::move(*scripts));
  }
  for (std::size_t i = 0; i < found.size(); ++i) LogScripts(State().scriptPath[i].full, found[i]);
}

// ---- The capture database -------------------------------------------------------------------------

CLIENT3_HANDLER(DatabaseCreate, Write) {
  std::string path(in.Text());
  std::string name(in.Text());
  std::string parent = ExistingDirectory(path);
  CheckComponent(name, "database");
  std::string database = Join(parent, name);
  if (platform::KindOf(database) != FileKind::Missing) Refuse("'" + database + "' exists already");
  if (!platform::MakeDirectory(database)) Refuse("cannot make the directory '" + database + "'");
  if (!platform::WriteFileAtomically(Join(database, kDatabaseFile), kDatabaseText) ||
      !platform::MakeDirectory(Join(database, kFirstSession)))
    Refuse("cannot write the database '" + database + "'");
  State().database = database, State().session = kFirstSession, State().take.clear();
}

CLIENT3_HANDLER(DatabaseGetCurrent, Read) {
  std::string item(in.Text());
  const Workspace& w = State();
  if (item == "Database") out.Put(w.database);
  else if (item == "Session") out.Put(w.session);
  else if (item == "Take") out.Put(w.take.empty() ? w.take : w.session + "/" + w.take);
  else Refuse("'" + item + "' is not one of Database, Session, Take");
}

CLIENT3_HANDLER(DatabaseSetCurrent, Write) {
  std::string item(in.Text());
  std::string path(in.Text());
  Workspace& w = State();
  if (item == "Database") {
    if (path.empty()) {
      w = Workspace{std::move(w.scriptPath), {}, {}, {}};
      return;
    }
    std::string full = platform::FullPath(FilePlace(path));
    if (full.empty() || !IsDatabase(full)) Refuse("'" + path + "' is not a capture database");
    w.database = full, w.session.clear(), w.take.clear();
  } else if (item == "Session") {
    const std::string& database = CurrentDatabase();
    if (!path.empty()) Inside(database, path, "session");
    w.session = path, w.take.clear();
  } else if (item == "Take") {
    const std::string& database = CurrentDatabase();
    if (path.empty()) {
      w.take.clear();
      return;
    }
    std::size_t slash = path.find('/');
    std::string session = slash == std::string::npos ? w.session : path.substr(0, slash);
    std::string take = slash == std::string::npos ? path : path.substr(slash + 1);
    if (slash == std::string::npos && session.empty()) Refuse("there is no current session: name the take as SESSION/TAKE");
    Inside(Inside(database, session, "session"), take, "take");
    w.session = session, w.take = take;
  } else {
    Refuse("'" + item + "' is not one of Database, Session, Take");
  }
}

CLIENT3_HANDLER(DatabaseGetMarkedTakes, Read) {
  const std::string& database = CurrentDatabase();
  std::vector<std::string> marked;
  for (const std::string& session : Subdirectories(database))
    for (const std::string& take : Subdirectories(Join(database, session)))
      if (platform::KindOf(Join(Join(Join(database, session), take), kMarkFile)) == FileKind::File)
        marked.push_back(session + "/" + take);
  out.PutTexts(marked, [](const std::string& s) -> std::string_view { return s; });
}

}  // namespace client3::host
