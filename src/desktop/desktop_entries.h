// Desktop entries: where they are looked for and what they are called.
#pragma once

#include <glib.h>

#include <optional>
#include <string>
#include <vector>

namespace kivi::detail {

// $XDG_DATA_HOME/applications (default ~/.local/share/applications), then
// each $XDG_DATA_DIRS/applications (default /usr/local/share:/usr/share),
// read now (GLib caches these for the process; tests change them).
std::vector<std::string> applicationDirectories();

// The desktop-file id of `path` below the applications directory `root`:
// the relative path with "/" made "-", without ".desktop".
std::string desktopFileId(const std::string& root, const std::string& path);

// The entry at `path` when it is a readable desktop entry (a [Desktop Entry]
// group) that is not Hidden; null otherwise. Free with g_key_file_unref.
GKeyFile* loadDesktopEntry(const std::string& path);

// The path of the entry with desktop-file id `id` (".desktop" optional) in
// applicationDirectories(), the first that loads; absent when none does.
std::optional<std::string> findDesktopEntry(std::string id);

// Every *.desktop file under `root`, files of a directory by name before its
// subdirectories (by name), recursively.
std::vector<std::string> desktopFilesUnder(const std::string& root);

// The program an entry runs: TryExec, else the first word of Exec; empty
// when neither can be read.
std::string entryProgram(GKeyFile* entry);

}  // namespace kivi::detail
