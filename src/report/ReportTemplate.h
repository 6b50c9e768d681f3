#pragma once

#include <string_view>

namespace VeltoTouch::ReportTemplate {

// The page's files, src/report/page/, compiled in by the build so that the
// tool needs nothing beside itself.
extern const std::string_view kHtml;
extern const std::string_view kStyle;
extern const std::string_view kScript;

}  // namespace VeltoTouch::ReportTemplate
