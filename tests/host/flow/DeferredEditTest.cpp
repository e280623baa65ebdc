// Edits a tool queues while it renders (OrvaneDoc::DocExecute) run in order,
// once, on RunDeferred; a select command's rectangle comes out in order.
#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "host/flow/ControlCommand.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane::deferrededittest {
namespace {

TEST(DeferredEdit, QueuedEditsRunOnceInOrderAfterTheRender) {
    OrvaneDoc doc;
    std::vector<int> applied;
    std::vector<std::thread> workers;
    for (int t = 0; t < 4; ++t) // from render threads, each queueing its own pair in its own order
        workers.emplace_back([&doc, &applied, t] {
            for (int k = 0; k < 2; ++k)
                doc.DocExecute([&applied, t, k](OrvaneDoc &) { applied.push_back(10 * t + k); },
                               "Pick " + std::to_string(10 * t + k));
        });
    for (std::thread &w : workers) w.join();
    EXPECT_TRUE(applied.empty()) << "nothing runs before RunDeferred";
    const std::vector<std::string> names = doc.RunDeferred();
    ASSERT_EQ(names.size(), 8u);
    ASSERT_EQ(applied.size(), 8u);
    for (size_t i = 0; i < names.size(); ++i) EXPECT_EQ(names[i], "Pick " + std::to_string(applied[i]));
    for (int t = 0; t < 4; ++t) { // each thread's edits keep their order
        std::vector<int> own;
        for (int v : applied)
            if (v / 10 == t) own.push_back(v);
        EXPECT_EQ(own, (std::vector<int>{10 * t, 10 * t + 1}));
    }
    EXPECT_TRUE(doc.RunDeferred().empty());
    EXPECT_EQ(applied.size(), 8u);
}

TEST(DeferredEdit, ASelectRectangleComesInOrderWithItsModifier) {
    const struct {
        double l, b, r, t;
        int modifiers;
        PickRect want;
    } cases[] = {
        {0.1, 0.2, 0.3, 0.4, 0, {0.1, 0.2, 0.3, 0.4, false}},
        {0.3, 0.4, 0.1, 0.2, CCMD_ModSubtract, {0.1, 0.2, 0.3, 0.4, true}},
        {0.5, 0.5, 0.5, 0.5, 2, {0.5, 0.5, 0.5, 0.5, false}},
    };
    for (const auto &c : cases) {
        const PickRect got = PickRect::FromTags({{CCMD_SelectLeft, c.l},
                                                 {CCMD_SelectBottom, c.b},
                                                 {CCMD_SelectRight, c.r},
                                                 {CCMD_SelectTop, c.t},
                                                 {CCMD_Modifiers, c.modifiers}});
        EXPECT_EQ(got.left, c.want.left);
        EXPECT_EQ(got.bottom, c.want.bottom);
        EXPECT_EQ(got.right, c.want.right);
        EXPECT_EQ(got.top, c.want.top);
        EXPECT_EQ(got.subtract, c.want.subtract);
    }
}

} // namespace
} // namespace Orvane::deferrededittest
