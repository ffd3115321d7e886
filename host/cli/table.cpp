#include "host/cli/table.h"

#include <algorithm>

#include "host/report/columns.h"

namespace appsync::host {

void writeTable(Output& output, const std::vector<Row>& rows) {
  std::vector<std::size_t> widths;
  for (const Row& row : rows) {
    widths.resize(std::max(widths.size(), row.size()));
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], displayWidth(row[i]));
    }
  }
  for (const Row& row : rows) {
    std::string line;
    for (std::size_t i = 0; i + 1 < row.size(); ++i) line += fitted(row[i], widths[i]) + "  ";
    if (!row.empty()) line += row.back();
    output.line(line);
  }
}

}  // namespace appsync::host
