// Where file commands may go. The user names directories on the command line (--files DIR); a file
// command then reaches only what lies inside one of them once every link and every ".." is
// resolved. With no directory named, file commands may use any path the application's user can.
#pragma once

#include <string>
#include <vector>

namespace client3::host {

// Sets the directories once, before any client is served; false (naming the first in `bad`) when
// one of them is not an existing directory.
bool ConfineFiles(const std::vector<std::string>& directories, std::string& bad);

// The path a file command uses for `path`: with directories named, its absolute form with every link
// resolved (for a path that does not exist yet, its directory's with the last name added), refused
// when that lies outside them; with none named, `path` itself.
std::string FilePlace(const std::string& path);

}  // namespace client3::host
