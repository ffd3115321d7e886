#include "host/report/json_line.h"

namespace appsync::host {

void writeJsonLine(Output& output, const Json& object) {
  output.line(object.dump(-1, ' ', false, Json::error_handler_t::replace));
}

Json textOrNull(const std::string& text) { return text.empty() ? Json() : Json(text); }

}  // namespace appsync::host
