#include "host/report/status_line.h"

#include <fmt/format.h>
#include <langinfo.h>

#include <algorithm>
#include <string_view>

#include "base/interruption.h"
#include "base/text.h"
#include "host/report/columns.h"

namespace appsync::host {
namespace {

constexpr std::string_view HideCursor = "\x1b[?25l";
constexpr std::string_view ShowCursor = "\x1b[?25h";
constexpr std::string_view EraseLine = "\r\x1b[K";
constexpr std::size_t BarColumns = 24;
constexpr std::size_t LeastLabelColumns = 8;

std::string repeated(std::string_view part, std::size_t count) {
  std::string text;
  while (count-- > 0) text += part;
  return text;
}

}  // namespace

StatusLine::StatusLine(Output& output, bool enabled)
    : output_(output),
      enabled_(enabled),
      unicode_(std::string_view(::nl_langinfo(CODESET)) == "UTF-8") {}

StatusLine::~StatusLine() { clear(); }

void StatusLine::draw(std::string text) {
  if (!enabled_ || text == shown_) return;
  setCursorHidden(true);
  output_.write(fmt::format("{}{}{}", shown_.empty() ? HideCursor : "", EraseLine, text));
  shown_ = std::move(text);
}

void StatusLine::showBar(const std::string& label, double fraction, const std::string& tail) {
  if (!enabled_) return;
  const double share = std::clamp(fraction, 0.0, 1.0);
  const std::string percent = fmt::format("{:3.0f}%  {}", share * 100, tail);
  // One column stays free, or the terminal would wrap.
  const std::size_t columns = output_.width() - 1;
  const std::size_t needed = displayWidth(percent) + 4 + BarColumns;
  if (columns < needed + LeastLabelColumns) {
    return draw(fitted(fmt::format("{:3.0f}%  {}", share * 100, label), columns));
  }
  const auto filled = static_cast<std::size_t>(share * BarColumns);
  const std::string bar =
      repeated(unicode_ ? "█" : "#", filled) + repeated(unicode_ ? "░" : "-", BarColumns - filled);
  const std::size_t labelColumns = std::min(displayWidth(printable(label)), columns - needed);
  draw(fmt::format("{}  {}  {}", fitted(label, labelColumns), bar, percent));
}

void StatusLine::showText(const std::string& text) {
  if (enabled_) {
    draw(fitted(text, std::min(displayWidth(printable(text)), output_.width() - 1)));
  }
}

void StatusLine::print(const std::string& line) {
  if (shown_.empty()) return output_.line(line);
  output_.write(fmt::format("{}{}\n{}", EraseLine, line, shown_));
}

void StatusLine::clear() {
  if (shown_.empty()) return;
  shown_.clear();
  output_.write(fmt::format("{}{}", EraseLine, ShowCursor));
  setCursorHidden(false);
}

}  // namespace appsync::host
