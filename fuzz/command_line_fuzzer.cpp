// Splits arbitrary bytes into arguments (at NUL and newline bytes) and runs apply's checks on them; what
// they accept is rendered onto a tiny image with the tile size and threads asked for, so that a value or an
// option that the checks let through cannot make the work or the memory unbounded.

#include "app/FilterArguments.h"
#include "app/Options.h"
#include "filters/Catalogue.h"
#include "pipeline/RenderJob.h"

#include <algorithm>
#include <string>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const bool linked = !RasterTools::GetFilterCatalogue().empty();
    (void)linked;
    std::vector<std::string> args{"apply"};
    std::string current;
    for (std::size_t i = 0; i < size; ++i) {
        const char c = char(data[i]);
        if (c == '\0' || c == '\n') {
            args.push_back(current);
            current.clear();
        } else {
            current += c;
        }
    }
    args.push_back(current);
    args.erase(args.begin()); // the subcommand's own arguments
    App::CheckedApply checked;
    try {
        checked = App::CheckApplyArguments(args);
    } catch (const App::Error& error) {
        const std::string message = error.what();
        // Messages quote short excerpts, never raw control bytes or whole arguments.
        if (message.size() > 4096) __builtin_trap();
        for (const char c : message)
            if (static_cast<unsigned char>(c) < 0x20) __builtin_trap();
        return 0;
    }
    const auto* pipeline = dynamic_cast<const RasterTools::PipelineCommand*>(checked.command.Get());
    if (!pipeline) __builtin_trap();
    // Whatever was accepted renders a small image within the fuzzer's time and memory limits.
    const auto format = Raster::PixelFormat::RGBA8;
    auto source = Raster::DynamicBuffer::Create(7, 5, format);
    const auto shape = pipeline->GetOutputShape(7, 5, format);
    auto destination = Raster::DynamicBuffer::Create(shape.width, shape.height, shape.format);
    if (!source || !destination) __builtin_trap();
    for (int y = 0; y < 5; ++y)
        for (int x = 0; x < 7 * 4; ++x)
            source->Row<std::uint8_t>(y)[x] = std::uint8_t(x * 37 + y * 11);
    RasterTools::RenderJobOptions job;
    job.tileSize = checked.tileSize;
    job.threads = std::min(checked.threads, 2);
    const auto result = RasterTools::RenderImage(*pipeline, source, destination, nullptr, job);
    if (!result.complete) __builtin_trap();
    return 0;
}
