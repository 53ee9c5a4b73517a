// The progress bar: drawn only after its delay, redrawn only when the percentage changes, ended with a line.

#include "app/Progress.h"

#include <gtest/gtest.h>
#include <sstream>

TEST(ProgressBar, DrawsAfterItsDelayAndOnlyWhenThePercentageChanges) {
    std::ostringstream out;
    {
        App::ProgressBar bar("render", &out, std::chrono::milliseconds(0));
        bar.Update(0.5);
        bar.Update(0.504); // still 50%
        bar.Callback()(1.0);
    }
    EXPECT_EQ(out.str(), "\rrender [###############               ] 50%"
                         "\rrender [##############################] 100%\n");

    std::ostringstream late;
    {
        App::ProgressBar bar("render", &late, std::chrono::hours(1));
        bar.Update(0.5);
        bar.Update(1.0);
    }
    EXPECT_EQ(late.str(), "") << "quick work shows no bar";
}
