/// libpulse passes memory between threads through lock-free lists that the thread sanitizer cannot
/// see into, for the library is not built with it. Those lists are in libpulsecommon, which never
/// calls this project's code itself: a race between its callbacks is still reported.
extern "C" const char* __tsan_default_suppressions() { return "race:libpulsecommon\n"; }
