// What the sanitizers misunderstand of other people's libraries; goes into every program of a
// sanitizer's build that links them.
#define SANITIZER_HOOK extern "C" [[gnu::visibility("default")]] const char*

// NOLINTBEGIN(bugprone-reserved-identifier): the sanitizers name them
SANITIZER_HOOK __lsan_default_suppressions();
SANITIZER_HOOK __lsan_default_options();
SANITIZER_HOOK __tsan_default_suppressions();
// NOLINTEND(bugprone-reserved-identifier)

// Fontconfig's patterns refer to their parts by distances instead of pointers, so the fonts that a
// process keeps until its end look lost.
const char* __lsan_default_suppressions() { return "leak:libfontconfig.so\n"; }

// Standard error is for the program alone.
const char* __lsan_default_options() { return "print_suppressions=0"; }

// Pango searches fonts on a thread of its own, and hands the result over by locks of GLib that the
// thread sanitizer does not see.
const char* __tsan_default_suppressions() {
  return "called_from_lib:libfontconfig.so\n"
         "called_from_lib:libglib-2.0.so\n"
         "called_from_lib:libpango-1.0.so\n"
         "called_from_lib:libpangoft2-1.0.so\n"
         "called_from_lib:libpangocairo-1.0.so\n"
         // The C library's time zone has a lock of its own, which the sanitizer does not see.
         "race:tzset_internal\n";
}
