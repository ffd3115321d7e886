#pragma once

#include <string>
#include <vector>

#include "host/report/output.h"

namespace appsync::host {

using Row = std::vector<std::string>;

/// Columns as wide as their widest cell; the last one of a row is left as it is.
void writeTable(Output& output, const std::vector<Row>& rows);

}  // namespace appsync::host
