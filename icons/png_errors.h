#pragma once

#include <png.h>

namespace appsync {

// How the PNG library reports: errors jump to the `setjmp` of its caller, warnings are not wanted.

[[noreturn]] inline void jumpOnPngError(png_structp png, png_const_charp) { png_longjmp(png, 1); }
inline void ignorePngWarning(png_structp, png_const_charp) {}

}  // namespace appsync
