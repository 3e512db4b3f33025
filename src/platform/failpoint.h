// Failpoints: named places in the platform layer where a test makes the
// operating system fail, to show that every write that matters leaves the
// old state or the new one. They are armed only in builds configured with
// HOXCM_FAILPOINTS=ON (the presets of the test suites). In any other build,
// the package's among them, the mechanism is not compiled at all: Failpoint()
// returns false and nothing reads the environment.
//
// A test arms points through the environment of the process it starts:
//     HOX_FAILPOINTS="store.commit=kill,rename:cm-plugin-input.json=error"
// "error" makes the point report a failure that its place then handles as
// the real one (an I/O error, EIO); "kill" ends the process with SIGKILL on
// the spot, as a power cut or the OOM killer would. The points are:
//     store.commit          before a store transaction commits
//     store.history         inside the transaction that appends a record to
//                           the apply history, before it commits
//     write:NAME            an atomic replacement of the file NAME, after
//                           its content is in the temporary file
//     rename:NAME           the same, before the rename over NAME
//     read:NAME             a bounded read of the file NAME
// NAME is the file's base name ("cm-plugin-output.json", "plugin.json").
//
// Thread-safe: the environment is only read.
#pragma once

#include <string_view>

namespace HoxPlatform {

// True when `point` (with `file`'s base name appended, when given) is armed
// with "error"; does not return when armed with "kill".
bool Failpoint(std::string_view point, std::string_view file = {});

}  // namespace HoxPlatform
