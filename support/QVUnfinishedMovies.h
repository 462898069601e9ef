#pragma once

namespace qv {

/// Finishes every movie of the temporary store that a crash or a loss of power left unfinished, and keeps it
/// under a name of its own ("Chess_recovered_02-29-2024 19-35-12.mp4", with the time at which it broke off), so
/// that the next recording of that application does not replace it. From then on it ages out like the
/// others. What holds no whole picture is removed; what cannot be read or finished stays and ages out. Finished
/// movies, and those that another process is writing, are not touched. Every outcome but these is logged.
///
/// Threading: the caller's thread, at the daemon's start, before any recording.
void _srSalvageUnfinishedMovies();

}  // namespace qv
