#pragma once
// Filter names and `--PARAM VALUE` arguments on the command line, shared by apply and doc filter.

#include "filters/Catalogue.h"

#include <string>
#include <utility>
#include <vector>

namespace App {

// The catalogue entry for name; a UsageError listing the filters when there is none.
const RasterTools::FilterInfo& RequireFilter(const std::string& name);

// The filter's defaults with the given (name, text) pairs parsed over them, in parameter order. An unknown
// name, a value that does not parse or one out of range is a UsageError saying what is accepted.
std::vector<RasterTools::ParameterValue>
ParseFilterParameters(const RasterTools::FilterInfo& filter,
                      const std::vector<std::pair<std::string, std::string>>& parameters);

// "--format rgba16 --scale 1,1": a command's parameters as they would be typed.
std::string DescribeParameterValues(const RasterTools::FilterInfo& filter,
                                    const std::vector<RasterTools::ParameterValue>& values);

// A whole number of at least minimum for option, or a UsageError.
int ParseCount(const std::string& option, const std::string& text, int minimum);

// The layer formats' names, comma separated.
std::string LayerFormatNames();

} // namespace App
