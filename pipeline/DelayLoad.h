#pragma once
// The host's log texts for a bitmap whose pixels are still to be loaded when something outside a pipeline
// session reads or writes it, kept exactly as the host prints them. A filter that reads a second image
// outside the pipeline asks the bitmap's IsPendingDelayLoad() first.

#include <string_view>

namespace RasterTools {

inline constexpr std::string_view BlockingWriteDelayLoadText =
    "Bitmap<> is performing a blocking, non-abortable delay-load in response to a non-pipeline PixelAccessor "
    "session - you should try to avoid this.";
inline constexpr std::string_view BlockingReadDelayLoadText =
    "Bitmap<> is performing a blocking, abortable delay-load in response to a non-pipeline "
    "ConstPixelAccessor "
    "session - you should try to avoid this.";

} // namespace RasterTools
