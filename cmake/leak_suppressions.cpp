// Goes into the programs of the address sanitizer that draw text. Fontconfig's patterns refer to
// their parts by distances instead of pointers, so the fonts that a process keeps until its end
// look lost to the leak checker.
extern "C" {
[[gnu::visibility("default")]] const char* __lsan_default_suppressions();
[[gnu::visibility("default")]] const char* __lsan_default_options();

const char* __lsan_default_suppressions() { return "leak:libfontconfig.so\n"; }
// Standard error is for the program alone.
const char* __lsan_default_options() { return "print_suppressions=0"; }
}
