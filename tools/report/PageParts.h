#pragma once

#include <string_view>

/// The files that a page is made of, which the build puts into the program (cmake/Embed.cmake).
namespace tamblo::report::page_parts {

extern const std::string_view page_html;
extern const std::string_view page_css;
extern const std::string_view plots_js;
extern const std::string_view data_js;
extern const std::string_view timeline_js;
extern const std::string_view timeline_input_js;
extern const std::string_view timeline_rows_js;
extern const std::string_view figures_js;
extern const std::string_view details_js;
extern const std::string_view page_js;

} // namespace tamblo::report::page_parts
