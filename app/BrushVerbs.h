#pragma once
// The command line's brush verbs: the pixel tool's verbs in play scripts and `doc paint`. Kept apart from the
// filter verbs so that each can change without the other.

#include "host/document/DocumentController.h"

#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace App {

// The brush tool of this name ("pixel"), or null.
Kernel::Counted<Tool> FindBrushTool(DocumentController& controller, const std::string& name);
extern const char* const kBrushToolNames;
extern const char* const kBrushVerbs;

// Runs words when they are a brush verb (stroke, latch, mode, snapshot, colour, brush-size, context): nothing
// when they are not one, else an empty string on success or the problem.
std::optional<std::string> RunBrushVerb(DocumentController& controller, const Kernel::Counted<Tool>& tool,
                                        const std::vector<std::string>& words, std::ostream& out);

// rastertools doc paint DOC --stroke X0,Y0 X1,Y1 ... [--colour R,G,B] [--size N] [--erase | --from-snapshot
// [--snapshot N]]
int RunDocPaint(const std::vector<std::string>& args);

} // namespace App
