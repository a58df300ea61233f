// What a program finds on the machine that it starts on: who runs it, folders, sockets, programs. Nothing is changed by
// looking. Free functions, thread-safe as long as nobody changes the environment.
#pragma once

#include "common/Settings.h"

#include <cstdint>
#include <optional>
#include <string>

namespace vela::platform {

/// The environment variable `name`; empty where it is not set.
std::string environmentText(const char* name);

/// Who runs this process, and the folders that its environment names.
SettingsEnvironment processEnvironment();

enum class FolderState : std::uint8_t { Writable, NotWritable, CanBeCreated, CannotBeCreated, NoFolder };

/// What this process may do with the folder `path`.
FolderState folderState(const std::string& path);

/// Where the kernel's trace file system is mounted with its files, writable or not; none where it is not.
std::optional<std::string> traceFolder();

/// Whether this process may make trace instances in `folder`.
bool canMakeTraceInstances(const std::string& folder);

/// The file that starting the program `name` would run, by $PATH.
std::optional<std::string> findProgram(const std::string& name);

bool isTerminal(int descriptor);

/// Whether standard error goes straight to the service manager's log, which then reads a level at the line's begin.
bool isStandardErrorJournal();

} // namespace vela::platform
