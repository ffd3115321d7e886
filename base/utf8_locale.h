#pragma once

#include <locale.h>

namespace appsync {

/// While it lives, the calling thread's character encoding is UTF-8 whatever the person's locale:
/// the archive library asks the thread's for entry names.
class Utf8Locale {
 public:
  Utf8Locale() : previous_(::uselocale(shared())) {}
  ~Utf8Locale() { ::uselocale(previous_); }
  Utf8Locale(const Utf8Locale&) = delete;
  Utf8Locale& operator=(const Utf8Locale&) = delete;

 private:
  static locale_t shared() {
    static const locale_t locale = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
    return locale;
  }
  const locale_t previous_;
};

}  // namespace appsync
