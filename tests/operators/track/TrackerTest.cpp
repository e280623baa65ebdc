// The Tracker tool: the step's adaptive gate and the fitted motion against values worked out here, the tracker list
// through documents, and tracking runs (path keys, append mode, aborts, Match Move) over a texture that moves by a
// known number of pixels per frame.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <string>
#include <tuple>
#include <vector>

#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/InputAt.h"
#include "host/flow/InputValue.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/QuadMap.h"
#include "host/image/ResizeFilters.h"
#include "operators/track/MatchMove.h"
#include "operators/track/TrackerStep.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

namespace T = Orvane::Test;
using tracking::PathPoint;
using tracking::RunStats;

TEST(TrackerStep, AdaptiveGateKeepsOrDropsAsTheRunsMeanSays) {
    // f = count * match / sum (0 before anything is counted, 100 for a sum that is not positive); a step is dropped
    // when f > 1 / low. "counted" says whether the match value then joins the sum.
    const struct {
        int count;
        float sum;
        double match;
        float low;
        double f;
        bool kept, counted;
    } cases[] = {
        {0, 0.0f, 0.5, 0.3f, 0.0, true, true},      // a first step is always kept
        {3, 0.0f, 0.01, 0.3f, 100.0, false, false}, // nothing positive counted: f = 100 > 3.33
        {3, 0.0f, 0.01, 0.0f, 100.0, true, true},   // the same with the mode off: kept
        {0, 0.0f, 1e-8, 0.3f, 0.0, true, false},    // at the floor: appended, not counted
        {4, 0.4f, 0.3, 0.3f, 3.0, true, true},      // three times the mean: within 3.33
        {4, 0.4f, 0.34, 0.3f, 3.4, false, false},   // 3.4 times the mean: dropped
        {2, 0.2f, 0.1, 0.3f, 2.0 * 0.1 / 0.2f, true, true},
        {5, 1.0f, 1.1920928955078125e-7, 0.3f, 5 * 1.1920928955078125e-7 / 1.0, true, false}, // the floor itself
    };
    for (const auto &c : cases) {
        RunStats stats{c.sum, c.count};
        EXPECT_NEAR(tracking::AdaptiveFactor(stats, c.match), c.f, 1e-6) << c.count << " " << c.sum << " " << c.match;
        std::vector<PathPoint> points;
        const bool kept = tracking::TakeStep(stats, points, 0.25, 0.75, c.match, 0.125, -0.25, 7.0, c.low);
        EXPECT_EQ(kept, c.kept) << c.count << " " << c.sum << " " << c.match;
        EXPECT_EQ(points.size(), c.kept ? 1u : 0u);
        if (kept) {
            EXPECT_DOUBLE_EQ(points[0].x, 0.375);
            EXPECT_DOUBLE_EQ(points[0].y, 0.5);
            EXPECT_DOUBLE_EQ(points[0].time, 7.0);
        }
        EXPECT_EQ(stats.count, c.count + (c.counted ? 1 : 0));
        EXPECT_FLOAT_EQ(stats.sum, c.sum + (c.counted ? static_cast<float>(c.match) : 0.0f));
    }
}

TEST(MatchMove, FitRecoversAKnownMotionAndHonoursTheSwitches) {
    // Three trackers moved by a similarity worked in square units (y times the aspect 0.5): 10 degrees about
    // (0.4, 0.3), scale 1.25, then (0.05, -0.02) across.
    const double aspect = 0.5, angle = 10.0, scale = 1.25, tx = 0.05, ty = -0.02, cx = 0.4, cy = 0.3;
    const double c = std::cos(angle * M_PI / 180), sn = std::sin(angle * M_PI / 180);
    const auto move = [&](double x, double y) {
        const double ux = x - cx, uy = (y - cy) * aspect;
        return std::pair{cx + scale * (c * ux - sn * uy) + tx, cy + scale * (sn * ux + c * uy) / aspect + ty};
    };
    std::vector<tracking::TrackPair> pairs;
    for (auto [x, y] : {std::pair{0.2, 0.3}, {0.7, 0.4}, {0.5, 0.8}}) {
        const auto [mx, my] = move(x, y);
        pairs.push_back({x, y, mx, my});
    }
    const auto mean = [&](bool now) {
        double x = 0, y = 0;
        for (const auto &p : pairs) x += now ? p.x : p.rx, y += now ? p.y : p.ry;
        return std::pair{x / 3, y / 3};
    };
    const auto [mrx, mry] = mean(false);
    const auto [mx, my] = mean(true);
    const auto [manualX, manualY] = move(0.9, 0.1);
    const struct {
        const char *what;
        tracking::MotionOptions o;
        double angle, scale, pivotX, pivotY, moveX, moveY;
    } cases[] = {
        {"average", {.aspect = aspect}, angle, scale, mrx, mry, mx - mrx, my - mry},
        {"selected",
         {.pivot = tracking::Pivot::Selected, .selected = 1, .aspect = aspect},
         angle,
         scale,
         0.7,
         0.4,
         pairs[1].x - 0.7,
         pairs[1].y - 0.4},
        {"manual",
         {.pivot = tracking::Pivot::Manual, .manualX = 0.9, .manualY = 0.1, .aspect = aspect},
         angle,
         scale,
         0.9,
         0.1,
         manualX - 0.9,
         manualY - 0.1},
        {"no rotation, no scale",
         {.rotation = false, .scaling = false, .aspect = aspect},
         0.0,
         1.0,
         mrx,
         mry,
         mx - mrx,
         my - mry},
        {"no position", {.position = false, .aspect = aspect}, angle, scale, mrx, mry, 0.0, 0.0},
    };
    for (const auto &k : cases) {
        const tracking::Motion m = tracking::FitMotion(pairs, k.o);
        EXPECT_NEAR(m.angle, k.angle, 1e-9) << k.what;
        EXPECT_NEAR(m.scale, k.scale, 1e-12) << k.what;
        EXPECT_NEAR(m.pivotRefX, k.pivotX, 1e-12) << k.what;
        EXPECT_NEAR(m.pivotRefY, k.pivotY, 1e-12) << k.what;
        EXPECT_NEAR(m.moveX, k.moveX, 1e-12) << k.what;
        EXPECT_NEAR(m.moveY, k.moveY, 1e-12) << k.what;
    }
    // One tracker gives a translation only; none, no motion.
    const tracking::Motion one = tracking::FitMotion({pairs[2]}, {.aspect = aspect});
    EXPECT_EQ(std::tuple(one.angle, one.scale), std::tuple(0.0, 1.0));
    EXPECT_DOUBLE_EQ(one.moveX, pairs[2].x - 0.5);
    const tracking::Motion none = tracking::FitMotion({}, {});
    EXPECT_EQ(std::tuple(none.moveX, none.moveY, none.angle, none.scale), std::tuple(0.0, 0.0, 0.0, 1.0));
}

TEST(MatchMove, WeightsFadingAndTheSmoothReference) {
    // A pair of weight 0 changes nothing; a pair of weight 2 counts as that pair twice.
    const std::vector<tracking::TrackPair> base = {
        {0.2, 0.3, 0.25, 0.28}, {0.7, 0.4, 0.71, 0.47}, {0.5, 0.8, 0.6, 0.8}};
    std::vector<tracking::TrackPair> ignored = base, doubled = base, twice = base;
    ignored.push_back({0.1, 0.1, 0.9, 0.9, 0.0});
    doubled[1].weight = 2.0;
    twice.push_back(base[1]);
    const auto same = [](const tracking::Motion &a, const tracking::Motion &b) {
        return std::abs(a.moveX - b.moveX) + std::abs(a.moveY - b.moveY) + std::abs(a.angle - b.angle) +
                   std::abs(a.scale - b.scale) + std::abs(a.pivotRefX - b.pivotRefX) <
               1e-12;
    };
    EXPECT_TRUE(same(tracking::FitMotion(ignored, {}), tracking::FitMotion(base, {})));
    EXPECT_TRUE(same(tracking::FitMotion(doubled, {}), tracking::FitMotion(twice, {})));
    EXPECT_FALSE(same(tracking::FitMotion(doubled, {}), tracking::FitMotion(base, {})));

    // Fading: none at 0, the motion itself at 1, half the way (in log scale) at 0.5.
    const tracking::Motion m{0.4, 0.3, 0.1, -0.06, 12.0, 1.44};
    EXPECT_TRUE(same(tracking::FadeMotion(m, 1.0), m));
    const tracking::Motion none = tracking::FadeMotion(m, 0.0), half = tracking::FadeMotion(m, 0.5);
    EXPECT_EQ(std::tuple(none.moveX, none.moveY, none.angle, none.scale), std::tuple(0.0, 0.0, 0.0, 1.0));
    EXPECT_NEAR(half.moveX, 0.05, 1e-15);
    EXPECT_NEAR(half.angle, 6.0, 1e-15);
    EXPECT_NEAR(half.scale, 1.2, 1e-15);

    // The reference through knots of a path x = t^2 / 100, y = sin(t / 4) on 10..20: with two knots the straight line
    // between the ends, with more it passes through the path at the knots and stays near it between, and holds
    // beyond the ends.
    const auto path = [](double t, double &x, double &y) { x = t * t / 100, y = std::sin(t / 4); };
    double x, y, px, py;
    tracking::SmoothReference(10, 20, 2, 12.5, path, x, y);
    EXPECT_NEAR(x, 1.0 + 0.25 * 3.0, 1e-12);
    EXPECT_NEAR(y, 0.75 * std::sin(2.5) + 0.25 * std::sin(5.0), 1e-12);
    for (double t : {10.0, 12.5, 15.0, 17.5, 20.0}) {
        tracking::SmoothReference(10, 20, 5, t, path, x, y);
        path(t, px, py);
        EXPECT_NEAR(x, px, 1e-12) << t;
        EXPECT_NEAR(y, py, 1e-12) << t;
    }
    // Between knots 2.5 apart the cubic follows the parabola x exactly (its central tangents are exact inside)
    // and the sine to within the cubic's error (1.0e-3 here).
    tracking::SmoothReference(10, 20, 5, 13.75, path, x, y);
    path(13.75, px, py);
    EXPECT_NEAR(x, px, 1e-12);
    EXPECT_NEAR(y, py, 2e-3);
    tracking::SmoothReference(10, 20, 5, 25, path, x, y);
    path(20, px, py);
    EXPECT_EQ(std::tuple(x, y), std::tuple(px, py));
}

/// A 96 x 64 texture that moves by (2, -1) pixels a frame (wrapping around) within the region asked of it, and that
/// aborts its render at `abortAt`; it notes the region asked of it on each pixel request.
class MovingTexture : public ThreadedOperator {
public:
    MovingTexture(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        out_ = T::AddImageOut(this);
    }
    static constexpr int W = 96, H = 64, DX = 2, DY = -1;
    void Process(Request *req) override {
        if (req->IsPreCalc()) {
            req->SetOutputData(out_, NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, 8}, {ImgNoData, 1}}));
            return;
        }
        if (req->Time() == abortAt && req->GetTask()) req->GetTask()->Abort();
        asked.push_back(req->RoI() ? req->RoI()->rect : ImgRectI(0, 0, W, H));
        static const Ref<Image> texture = T::PatternImage(W, H, 8, 5);
        Ref<Image> img = NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, 8}});
        img->AllocScanLineData();
        const int sx = static_cast<int>(req->Time()) * DX, sy = static_cast<int>(req->Time()) * DY;
        // Only the region asked for has the texture (the rest stays 0), so a tracker that asks too little fails.
        const ImgRectI r = asked.back() & ImgRectI(0, 0, W, H);
        for (int y = r.y0; y < r.y1; ++y)
            for (int x = r.x0; x < r.x1; ++x)
                img->PutFlt(x, y, texture->GetFlt(((x - sx) % W + W) % W, ((y - sy) % H + H) % H));
        req->SetOutputData(out_, img);
    }
    double abortAt = -1e9;
    std::vector<ImgRectI> asked;

private:
    Output *out_;
};

struct MovingTextureClass {
    OvID id = T::RegisterTestTool(
        "TrackerMovingTexture", &T::MakeTool<MovingTexture>,
        {{RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)}, {RegUnpredictable, 1}});
};

class Tracker : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    void SetUp() override {
        source = dynamic_cast<MovingTexture *>(doc.AddTool(T::Once<MovingTextureClass>().id, "Texture1"));
        tracker = doc.AddTool(OvID("Tracker"), "Tracker1");
        ASSERT_TRUE(source && tracker);
        ASSERT_TRUE(tracker->FindInput("Input")->ConnectTo(source->FindMainOutput()));
    }
    /// The pixel centre (px, py) as a frame position.
    // The matcher lands a whole-pixel move of the texture within a hundredth of a pixel (its sub-pixel fit leaves
    // a few thousandths even on the pattern's own frame).
    static constexpr double kTrackX = 0.01 / MovingTexture::W, kTrackY = 0.01 / MovingTexture::H;
    static std::pair<double, double> At(int px, int py) {
        return {(px + 0.5) / MovingTexture::W, (py + 0.5) / MovingTexture::H};
    }
    bool Run(double from, double to, RenderTask *task = nullptr) {
        return tracker->ControlCommand(
            CCMD_Track,
            {{CCMD_TrackFrom, from}, {CCMD_TrackTo, to}, {CCMD_TrackTask, static_cast<const void *>(task)}});
    }
    /// The keys of TrackedCenter<n>: time, x, y.
    std::vector<std::vector<double>> Keys(int n) const {
        std::vector<std::vector<double>> keys;
        const AnimCurve *curve = tracker->FindInput(("TrackedCenter" + std::to_string(n)).c_str())->Curve();
        if (curve)
            for (const Keyframe &k : curve->Keys()) {
                const auto &p = dynamic_cast<const Point &>(*k.value);
                keys.push_back({k.time, p.x, p.y});
            }
        return keys;
    }
    OrvaneDoc doc;
    MovingTexture *source = nullptr;
    Operator *tracker = nullptr;
};

TEST_F(Tracker, TrackerListMakesAndRemovesTrackersAndRoundTripsThroughDocuments) {
    for (const char *id : {"Name1",
                           "Enabled1",
                           "Delete1",
                           "TrackerLabel1",
                           "Tracker1BestMatch",
                           "Tracker1Channel",
                           "Tracker1ShowChannel",
                           "PatternCenter1",
                           "PatternWidth1",
                           "PatternHeight1",
                           "SearchWidth1",
                           "SearchHeight1",
                           "TrackedCenter1",
                           "XOffset1",
                           "YOffset1",
                           "TrackForward",
                           "AdaptiveMode",
                           "PathCenter",
                           "Operation",
                           "Merge",
                           "ApplyMode",
                           "PivotType",
                           "Pivot",
                           "Reference",
                           "IncompleteTrackerFadeInOutFrames",
                           "SearchScale"})
        EXPECT_TRUE(tracker->FindInput(id)) << id;
    EXPECT_FALSE(tracker->FindInput("Name2"));
    EXPECT_EQ(dynamic_cast<const Text &>(*tracker->FindInput("Name1")->ValueAt(0)).value, "Point 1");

    // As `orvane set` gives it.
    Input *list = tracker->FindInput("TrackerList");
    ASSERT_EQ(ApplyInputValue(doc, list, InputValueFromText(doc, list, "{ 1, 2, 3 }")), "");
    ASSERT_TRUE(tracker->FindInput("Name3"));
    EXPECT_EQ(dynamic_cast<const Text &>(*tracker->FindInput("Name3")->ValueAt(0)).value, "Point 3");
    T::SetNumber(tracker, "Delete1", 1.0);
    EXPECT_FALSE(tracker->FindInput("Name1"));
    EXPECT_FALSE(tracker->FindInput("PatternCenter1"));
    T::SetPoint(tracker, "PatternCenter3", 0.25, 0.75);
    T::SetText(tracker, "Name2", "Corner");

    OrvaneDoc loaded;
    const DocumentLoadResult result = LoadDocument(SaveDocument(doc), loaded);
    ASSERT_TRUE(result.ok) << result.error;
    Operator *back = loaded.FindTool("Tracker1");
    ASSERT_TRUE(back);
    EXPECT_FALSE(back->FindInput("Name1"));
    const auto &p = dynamic_cast<const Point &>(*back->FindInput("PatternCenter3")->ValueAt(0));
    EXPECT_EQ(std::pair(p.x, p.y), std::pair(0.25, 0.75));
    EXPECT_EQ(dynamic_cast<const Text &>(*back->FindInput("Name2")->ValueAt(0)).value, "Corner");

    // An older document's pivot controls land on the new ones.
    OrvaneDoc old;
    const DocumentLoadResult older = LoadDocument(
        "Orvane.Document { Tools = { T = Tracker { Inputs = { AxisType = 2, Axis = { 0.125, 0.5 } } } } }", old);
    ASSERT_TRUE(older.ok) << older.error;
    EXPECT_EQ(dynamic_cast<const Number &>(*old.FindTool("T")->FindInput("PivotType")->ValueAt(0)).value, 2.0);
    const auto &axis = dynamic_cast<const Point &>(*old.FindTool("T")->FindInput("Pivot")->ValueAt(0));
    EXPECT_EQ(axis.x, 0.125);
}

TEST_F(Tracker, RunsFollowTheMovingTextureIntoPathKeys) {
    // The pattern at pixel (40, 30) on frame 0 is at (40 + 2t, 30 - t) on frame t.
    const auto [x0, y0] = At(40, 30);
    T::SetPoint(tracker, "PatternCenter1", x0, y0);
    const struct {
        double from, to;
        int every;
        std::vector<double> times;
    } cases[] = {
        {0, 5, 1, {0, 1, 2, 3, 4, 5}}, {0, 6, 4, {0, 4, 6}}, {0, -4, 2, {-4, -2, 0}}, // a reverse run
    };
    for (const auto &c : cases) {
        tracker->FindInput("TrackedCenter1")->ResetValue();
        T::SetNumber(tracker, "FramesPerPathPoint", c.every);
        source->asked.clear();
        ASSERT_TRUE(Run(c.from, c.to)) << T::ConsoleText(doc);
        // A tracking step asks the source for the search area only, not the frame.
        for (const ImgRectI &r : source->asked) {
            EXPECT_LT(r.Width(), MovingTexture::W) << T::RectText(r);
            EXPECT_LT(r.Height(), MovingTexture::H) << T::RectText(r);
        }
        const auto keys = Keys(1);
        ASSERT_EQ(keys.size(), c.times.size()) << c.from << ".." << c.to;
        for (size_t i = 0; i < keys.size(); ++i) {
            const double t = c.times[i];
            const auto [x, y] =
                At(40 + MovingTexture::DX * static_cast<int>(t), 30 + MovingTexture::DY * static_cast<int>(t));
            EXPECT_EQ(keys[i][0], t);
            EXPECT_NEAR(keys[i][1], x, kTrackX) << "frame " << t;
            EXPECT_NEAR(keys[i][2], y, kTrackY) << "frame " << t;
        }
    }
    // The tracker's position output is the path plus its offset.
    T::SetNumber(tracker, "XOffset1", 0.25);
    EvalOptions o;
    o.useCache = false;
    const Ref<Parameter> pos = Evaluate(tracker->FindOutput("Position1"), -2.0, o);
    const auto [px, py] = At(40 - 4, 30 + 2);
    ASSERT_TRUE(dynamic_cast<const Point *>(pos.Get()));
    EXPECT_NEAR(dynamic_cast<const Point &>(*pos).x, px + 0.25, kTrackX);
    EXPECT_NEAR(dynamic_cast<const Point &>(*pos).y, py, kTrackY);
}

TEST_F(Tracker, AppendModeContinuesThePathAndAbortsKeepWhatWasTracked) {
    // A path that stands 0.1 to the right of the pattern at frame 0: an appending run keeps that offset.
    const auto [x0, y0] = At(40, 30);
    T::SetPoint(tracker, "PatternCenter1", x0, y0);
    AnimCurve path;
    path.SetKey(0.0, MakeRef<Point>(x0 + 0.1, y0));
    path.SetKey(-10.0, MakeRef<Point>(0.0, 0.0));
    ASSERT_TRUE(tracker->FindInput("TrackedCenter1")->SetCurve(path));
    T::SetNumber(tracker, "PathCenter", 1.0);
    source->abortAt = 3.0;
    RenderTask task;
    ASSERT_TRUE(Run(0, 6, &task));
    const auto keys = Keys(1);
    ASSERT_EQ(keys.size(), 4u); // the key before the run, and frames 0, 1, 2: the abort at frame 3 ends the run
    EXPECT_EQ(keys[0][0], -10.0);
    for (size_t i = 1; i < keys.size(); ++i) {
        const int t = static_cast<int>(i) - 1;
        const auto [x, y] = At(40 + MovingTexture::DX * t, 30 + MovingTexture::DY * t);
        EXPECT_EQ(keys[i][0], t);
        EXPECT_NEAR(keys[i][1], x + 0.1, kTrackX) << t;
        EXPECT_NEAR(keys[i][2], y, kTrackY) << t;
    }
}

TEST_F(Tracker, ModifierDrivesAPointInputByItsTrack) {
    Operator *mod = doc.AddTool(OvID("TrackerModifier"), "TrackerModifier1");
    Operator *xf = doc.AddTool(OvID("Transform"), "Transform1");
    ASSERT_TRUE(mod && xf);
    ASSERT_TRUE(mod->FindInput("Input")->ConnectTo(source->FindMainOutput()));
    ASSERT_TRUE(xf->FindInput("Center")->ConnectTo(mod->FindOutput("Position1")));
    const auto [x0, y0] = At(20, 40);
    T::SetPoint(mod, "PatternCenter1", x0, y0);
    ASSERT_TRUE(mod->ControlCommand(CCMD_Track, {{CCMD_TrackFrom, 0.0}, {CCMD_TrackTo, 3.0}})) << T::ConsoleText(doc);
    for (int t = 0; t <= 3; ++t) {
        double x = 0, y = 0;
        InputPointAt(nullptr, xf->FindInput("Center"), t, x, y);
        const auto [wx, wy] = At(20 + MovingTexture::DX * t, 40 + MovingTexture::DY * t);
        EXPECT_NEAR(x, wx, kTrackX) << t;
        EXPECT_NEAR(y, wy, kTrackY) << t;
    }
}

TEST_F(Tracker, MatchMoveSteadiesTheShotAtItsReference) {
    // Two trackers over frames 0..4; "BG only" at frame 3 is frame 0 again where frame 3 covers it.
    ScriptVal list = ScriptVal::Table();
    for (int n : {1, 2}) list.Append(n);
    ASSERT_TRUE(tracker->FindInput("TrackerList")->SetValue(MakeRef<ScriptValue>(list)));
    const auto [ax, ay] = At(30, 20);
    const auto [bx, by] = At(60, 40);
    T::SetPoint(tracker, "PatternCenter1", ax, ay);
    T::SetPoint(tracker, "PatternCenter2", bx, by);
    ASSERT_TRUE(Run(0, 4)) << T::ConsoleText(doc);
    T::SetNumbers(tracker, {{"Operation", 1}, {"Merge", 0}});
    EvalOptions o;
    o.useCache = false;
    const Ref<Parameter> steady = Evaluate(tracker->FindOutput("SteadyPosition"), 3.0, o);
    ASSERT_TRUE(dynamic_cast<const Point *>(steady.Get())) << T::ConsoleText(doc);
    EXPECT_NEAR(dynamic_cast<const Point &>(*steady).x, 0.5 - 3.0 * MovingTexture::DX / MovingTexture::W, 1e-12);
    EXPECT_NEAR(dynamic_cast<const Point &>(*steady).y, 0.5 - 3.0 * MovingTexture::DY / MovingTexture::H, 1e-12);
    const Ref<Parameter> size = Evaluate(tracker->FindOutput("SteadySize"), 3.0, o);
    EXPECT_NEAR(dynamic_cast<const Number &>(*size).value, 1.0, 1e-12);
    const Ref<Image> frame3 = T::EvalImage(tracker, 3.0, o);
    const Ref<Image> frame0 = T::EvalImage(source, 0.0, o);
    ASSERT_TRUE(frame3 && frame0) << T::ConsoleText(doc);
    double worst = 0.0;
    for (int y = 8; y < MovingTexture::H - 8; ++y)
        for (int x = 8; x < MovingTexture::W - 8; ++x) {
            const FltPixel a = frame3->GetFlt(x, y), b = frame0->GetFlt(x, y);
            worst = std::max(
                {worst, std::fabs(double(a.R) - b.R), std::fabs(double(a.G) - b.G), std::fabs(double(a.A) - b.A)});
        }
    EXPECT_LT(worst, 1e-5);
    // "FG only": a still Foreground moves with the shot, (2, -1) pixels a frame since frame 0.
    const Ref<Image> still = T::PatternImage(MovingTexture::W, MovingTexture::H, 8, 9);
    ASSERT_TRUE(tracker->FindInput("Foreground")->ConnectTo(T::AddImageSource(doc, "Still1", still)->Out()));
    T::SetNumber(tracker, "Merge", 1);
    const Ref<Image> moved = T::EvalImage(tracker, 3.0, o);
    ASSERT_TRUE(moved) << T::ConsoleText(doc);
    worst = 0.0;
    for (int y = 8; y < MovingTexture::H - 8; ++y)
        for (int x = 8; x < MovingTexture::W - 8; ++x) {
            const FltPixel a = moved->GetFlt(x, y),
                           b = still->GetFlt(x - 3 * MovingTexture::DX, y - 3 * MovingTexture::DY);
            worst = std::max({worst, std::fabs(double(a.R) - b.R), std::fabs(double(a.B) - b.B)});
        }
    EXPECT_LT(worst, 1e-5);
    // "FG over BG" and "BG over FG": the moving Foreground and the Input, one laid over the other.
    const Ref<Image> plate = T::EvalImage(source, 3.0, o);
    for (int merge : {2, 3}) {
        T::SetNumber(tracker, "Merge", merge);
        const Ref<Image> out = T::EvalImage(tracker, 3.0, o);
        ASSERT_TRUE(out && plate) << T::ConsoleText(doc);
        worst = 0.0;
        for (int y = 8; y < MovingTexture::H - 8; ++y)
            for (int x = 8; x < MovingTexture::W - 8; ++x) {
                const FltPixel fg = still->GetFlt(x - 3 * MovingTexture::DX, y - 3 * MovingTexture::DY),
                               bg = plate->GetFlt(x, y), got = out->GetFlt(x, y);
                const FltPixel &top = merge == 2 ? fg : bg, &under = merge == 2 ? bg : fg;
                const double keep = 1.0 - top.A;
                worst = std::max({worst, std::fabs(got.R - (top.R + keep * under.R)),
                                  std::fabs(got.G - (top.G + keep * under.G)),
                                  std::fabs(got.A - (top.A + keep * under.A))});
            }
        EXPECT_LT(worst, 1e-5) << "merge " << merge;
    }
}

TEST_F(Tracker, CornerPositioningPinsTheForegroundAndPerspectiveTakesItBack) {
    // Four trackers on a quad of the 96 x 64 Input (pixels): bottom-left, bottom-right, top-right, top-left.
    const QuadPoint quad[4] = {{10, 6}, {86, 10}, {80, 58}, {14, 54}};
    ScriptVal list = ScriptVal::Table();
    for (int n : {1, 2, 3, 4}) list.Append(n);
    ASSERT_TRUE(tracker->FindInput("TrackerList")->SetValue(MakeRef<ScriptValue>(list)));
    for (int n = 1; n <= 4; ++n) {
        AnimCurve path;
        path.SetKey(0.0, MakeRef<Point>(quad[n - 1].x / MovingTexture::W, quad[n - 1].y / MovingTexture::H));
        ASSERT_TRUE(tracker->FindInput(("TrackedCenter" + std::to_string(n)).c_str())->SetCurve(path));
    }
    // A 40 x 30 Foreground whose pixel (x, y) holds (x, y): where a sample came from.
    const int fw = 40, fh = 30;
    Ref<Image> fg = NewImageTagList({{ImgWidth, fw}, {ImgHeight, fh}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(fg->AllocScanLineData());
    for (int y = 0; y < fh; ++y)
        for (int x = 0; x < fw; ++x) fg->PutFlt(x, y, {float(x), float(y), 0, 1});
    ASSERT_TRUE(tracker->FindInput("Foreground")->ConnectTo(T::AddImageSource(doc, "Still1", fg)->Out()));
    const QuadPoint frame[4] = {{0, 0}, {double(fw), 0}, {double(fw), double(fh)}, {0, double(fh)}};
    EvalOptions o;
    o.useCache = false;

    struct Case {
        const char *name;
        int mapping; ///< 0 bilinear, 1 perspective
        int turns;   ///< Rotate Clockwise presses
    } cases[] = {{"perspective", 1, 0}, {"bilinear", 0, 0}, {"perspective, turned clockwise", 1, 1}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        // Nearest, so that each output pixel holds the coordinates of the one foreground pixel it took.
        T::SetNumbers(
            tracker,
            {{"Operation", 2}, {"Merge", 1}, {"MappingType", c.mapping}, {"FilterMethod", RszNearest - RszFirst}});
        for (int k = 0; k < c.turns; ++k) T::SetNumber(tracker, "RotateClockwise", 1);
        // Foreground corner i goes to the point i + turns around the quad, a turn being a quarter clockwise.
        QuadPoint target[4];
        for (int i = 0; i < 4; ++i) target[i] = quad[(i + 4 - c.turns) % 4];
        Matrix3 toFg, toOut;
        ASSERT_TRUE(HomographyFromPoints(target, frame, toFg));
        ASSERT_TRUE(HomographyFromPoints(frame, target, toOut));
        BilinearQuad bilinear;
        ASSERT_TRUE(bilinear.Set(target));
        const auto forward = [&](double fx, double fy, double &x, double &y) {
            if (c.mapping == 1)
                toOut.Apply(fx, fy, x, y);
            else
                bilinear.Forward(fx / fw, fy / fh, x, y);
        };
        const auto back = [&](double x, double y, double &fx, double &fy) {
            if (c.mapping == 1) return toFg.Apply(x, y, fx, fy);
            double s, t;
            ASSERT_TRUE(bilinear.Inverse(x, y, s, t));
            fx = s * fw, fy = t * fh;
        };
        const Ref<Image> pinned = T::EvalImage(tracker, 0.0, o);
        ASSERT_TRUE(pinned) << T::ConsoleText(doc);
        EXPECT_EQ(pinned->Width(), MovingTexture::W);
        // Each corner pixel of the foreground lands on its point, and inner pixels where the map sends them.
        int checked = 0;
        for (double s : {0.0, 0.2, 0.5, 0.8, 1.0})
            for (double t : {0.0, 0.35, 0.5, 1.0}) {
                const double fx = std::clamp(s * fw, 0.5, fw - 0.5), fy = std::clamp(t * fh, 0.5, fh - 0.5);
                double x, y, bx, by;
                forward(fx, fy, x, y);
                const int i = int(std::floor(x)), j = int(std::floor(y));
                back(i + 0.5, j + 0.5, bx, by);
                if (std::fabs(bx - std::round(bx)) < 1e-6 || std::fabs(by - std::round(by)) < 1e-6) continue;
                const FltPixel p = pinned->GetFlt(i, j);
                EXPECT_EQ(p.R, std::floor(bx)) << s << "," << t;
                EXPECT_EQ(p.G, std::floor(by)) << s << "," << t;
                ++checked;
            }
        EXPECT_GE(checked, 15);
        for (int i = 0; i < 4; ++i) {
            // The centre of the foreground's corner pixel lies within a pixel of the tracked point.
            const double fx = frame[i].x == 0 ? 0.5 : fw - 0.5, fy = frame[i].y == 0 ? 0.5 : fh - 0.5;
            double x, y;
            forward(fx, fy, x, y);
            double cx, cy;
            forward(frame[i].x, frame[i].y, cx, cy);
            EXPECT_LT(std::hypot(cx - target[i].x, cy - target[i].y), 1e-9) << i;
            const FltPixel p = pinned->GetFlt(int(x), int(y));
            EXPECT_EQ(std::tuple(p.R, p.G), std::tuple(float(fx - 0.5), float(fy - 0.5))) << i;
        }
        for (int k = 0; k < c.turns; ++k) T::SetNumber(tracker, "RotateCounterClockwise", 1);
    }

    // Perspective Positioning of the pinned picture gives the foreground back, stretched to the Input's frame.
    Operator *undo = doc.AddTool(OvID("Tracker"), "Tracker2");
    ASSERT_TRUE(undo && undo->FindInput("Input")->ConnectTo(tracker->FindMainOutput()));
    ASSERT_TRUE(undo->FindInput("TrackerList")->SetValue(MakeRef<ScriptValue>(list)));
    for (int n = 1; n <= 4; ++n) {
        const std::string id = "TrackedCenter" + std::to_string(n);
        ASSERT_TRUE(undo->FindInput(id.c_str())->SetCurve(*tracker->FindInput(id.c_str())->Curve()));
    }
    T::SetNumbers(tracker,
                  {{"Operation", 2}, {"Merge", 1}, {"MappingType", 1}, {"FilterMethod", RszLinear - RszFirst}});
    T::SetNumbers(undo, {{"Operation", 3}, {"Merge", 0}, {"MappingType", 1}, {"FilterMethod", RszLinear - RszFirst}});
    const Ref<Image> back = T::EvalImage(undo, 0.0, o);
    ASSERT_TRUE(back) << T::ConsoleText(doc);
    double worst = 0.0;
    const double sx = double(fw) / MovingTexture::W, sy = double(fh) / MovingTexture::H;
    for (int y = 4; y < MovingTexture::H - 4; ++y)
        for (int x = 4; x < MovingTexture::W - 4; ++x) {
            const FltPixel p = back->GetFlt(x, y);
            const double e = std::max(std::fabs(p.R - ((x + 0.5) * sx - 0.5)), std::fabs(p.G - ((y + 0.5) * sy - 0.5)));
            worst = std::max(worst, e);
        }
    EXPECT_LT(worst, 5e-3); // foreground pixels: linear filtering twice of a linear ramp

    // Un-warping a corner of the frame reads the Input far from that corner: a small region asked of the tool gives
    // the same pixels as the whole frame (the texture renders only what is asked of it).
    T::SetNumbers(tracker, {{"Operation", 3}, {"Merge", 0}});
    const ImgRectI corner(0, 0, 12, 12);
    EvalOptions small = o;
    small.roi = ImageDomain(corner);
    const Ref<Image> whole = T::EvalImage(tracker, 0.0, o), part = T::EvalImage(tracker, 0.0, small);
    ASSERT_TRUE(whole && part) << T::ConsoleText(doc);
    worst = 0.0;
    for (int y = 0; y < 12; ++y)
        for (int x = 0; x < 12; ++x) {
            const FltPixel a = whole->GetFlt(x, y), b = part->GetFlt(x, y);
            worst = std::max({worst, std::fabs(double(a.R) - b.R), std::fabs(double(a.G) - b.G), double(a.A == 0)});
        }
    EXPECT_EQ(worst, 0.0);

    // Fewer than four trackers with paths: one console line, no picture.
    undo->FindInput("TrackedCenter4")->ResetValue();
    EXPECT_FALSE(T::EvalImage(undo, 0.0, o));
    EXPECT_NE(T::ConsoleText(doc).find("Tracker2: corner positioning needs four enabled trackers"), std::string::npos)
        << T::ConsoleText(doc);
}

TEST_F(Tracker, IncompleteTrackersFadeAndIntermediatePointsShapeTheReference) {
    // One tracker tracked on frames 10..20 of a shot of 0..100, x = 0.3 + (t - 10)^2 / 1000 (0.3 to 0.4), y 0.5.
    AnimCurve path;
    for (int t = 10; t <= 20; ++t) path.SetKey(t, MakeRef<Point>(0.3 + (t - 10) * (t - 10) / 1000.0, 0.5));
    ASSERT_TRUE(tracker->FindInput("TrackedCenter1")->SetCurve(path));
    T::SetNumbers(tracker, {{"Operation", 1}, {"Merge", 0}, {"Position", 1}, {"Rotation", 0}, {"Scaling", 0}});
    EvalOptions o;
    o.useCache = false;
    const auto steadyX = [&](double t) {
        const Ref<Parameter> p = Evaluate(tracker->FindOutput("SteadyPosition"), t, o);
        return p ? dynamic_cast<const Point &>(*p).x : NAN;
    };
    const struct {
        const char *name;
        int reference, intermediate, fade;
        double time, expected; ///< 0.5 less the tracker's movement since its reference, faded
    } cases[] = {
        {"inside", 1, 0, 25, 15, 0.5 - 0.025},
        {"13 of 25 + 1 frames after the end: half", 1, 0, 25, 33, 0.5 - 0.1 * 0.5},
        {"26 frames after: none", 1, 0, 25, 46, 0.5},
        {"no fade frames: none after the end", 1, 0, 0, 21, 0.5},
        {"before the start, from the End reference", 3, 0, 25, 10 - 13, 0.5 + 0.1 * 0.5},
        {"start & end: the straight line", 2, 0, 25, 15, 0.5 - (0.325 - 0.35)},
        {"start & end through the middle: on the path there", 2, 1, 25, 15, 0.5},
        {"start & end, two points: on the path at a third", 2, 2, 25, 10 + 10.0 / 3, 0.5},
    };
    for (const auto &c : cases) {
        T::SetNumbers(tracker, {{"Reference", c.reference},
                                {"ReferenceIntermediatePoints", c.intermediate},
                                {"IncompleteTrackerFadeInOutFrames", c.fade}});
        EXPECT_NEAR(steadyX(c.time), c.expected, 1e-9) << c.name;
    }
    // A track over the whole shot has no end to fade from: its held movement applies in full.
    doc.SetRenderRange(10, 20);
    T::SetNumbers(tracker, {{"Reference", 1}, {"IncompleteTrackerFadeInOutFrames", 0}});
    EXPECT_NEAR(steadyX(30), 0.4, 1e-9);
}

TEST_F(Tracker, PerspectivePositionsLieInThePlaneOfTheCorners) {
    // Trackers 1..4 on a quad, tracker 5 where the mapping puts (0.25, 0.75) of the rectangle they stand for.
    const QuadPoint quad[4] = {{0.1, 0.1}, {0.9, 0.15}, {0.8, 0.9}, {0.15, 0.85}};
    const QuadPoint unit[4] = {{0, 0}, {1, 0}, {1, 1}, {0, 1}};
    ScriptVal list = ScriptVal::Table();
    for (int n : {1, 2, 3, 4, 5}) list.Append(n);
    ASSERT_TRUE(tracker->FindInput("TrackerList")->SetValue(MakeRef<ScriptValue>(list)));
    EvalOptions o;
    o.useCache = false;
    for (int mapping : {0, 1}) {
        double x5, y5;
        if (mapping == 1) {
            Matrix3 h;
            ASSERT_TRUE(HomographyFromPoints(unit, quad, h));
            h.Apply(0.25, 0.75, x5, y5);
        } else {
            BilinearQuad b;
            ASSERT_TRUE(b.Set(quad));
            b.Forward(0.25, 0.75, x5, y5);
        }
        for (int n = 1; n <= 5; ++n) {
            AnimCurve path;
            path.SetKey(0.0, n < 5 ? MakeRef<Point>(quad[n - 1].x, quad[n - 1].y) : MakeRef<Point>(x5, y5));
            ASSERT_TRUE(tracker->FindInput(("TrackedCenter" + std::to_string(n)).c_str())->SetCurve(path));
        }
        for (int operation : {0, 2, 3}) {
            T::SetNumbers(tracker, {{"Operation", operation}, {"MappingType", mapping}});
            const auto at = [&](int n) {
                const Ref<Parameter> p =
                    Evaluate(tracker->FindOutput(("PerspectivePosition" + std::to_string(n)).c_str()), 0.0, o);
                const auto *pt = dynamic_cast<const Point *>(p.Get());
                return pt ? std::pair{pt->x, pt->y} : std::pair{double(NAN), double(NAN)};
            };
            // Without corners the perspective position is the position itself.
            const auto [x, y] = at(5);
            const auto [cornerX, cornerY] = at(3);
            EXPECT_NEAR(x, operation ? 0.25 : x5, 1e-9) << mapping << " " << operation;
            EXPECT_NEAR(y, operation ? 0.75 : y5, 1e-9) << mapping << " " << operation;
            EXPECT_NEAR(cornerX, operation ? 1.0 : quad[2].x, 1e-9) << mapping << " " << operation;
            EXPECT_NEAR(cornerY, operation ? 1.0 : quad[2].y, 1e-9) << mapping << " " << operation;
        }
    }
    // The paths hold one key, at frame 0, of a shot of 0..100: a card pinned "FG over BG" shows at frame 0, fades
    // over the 25 frames after it, and is gone by frame 26, where the output is the plate.
    ASSERT_TRUE(
        tracker->FindInput("Foreground")->ConnectTo(T::AddImageSource(doc, "Card1", T::PatternImage(40, 30))->Out()));
    T::SetNumbers(tracker, {{"Operation", 2}, {"Merge", 2}});
    const auto differs = [&](double t) {
        const Ref<Image> out = T::EvalImage(tracker, t, o), plate = T::EvalImage(source, t, o);
        double worst = 0;
        for (int y = 0; y < MovingTexture::H; ++y)
            for (int x = 0; x < MovingTexture::W; ++x)
                worst = std::max(worst, std::fabs(double(out->GetFlt(x, y).R) - plate->GetFlt(x, y).R));
        return worst;
    };
    const double full = differs(0), half = differs(13);
    EXPECT_GT(full, 0.1);
    EXPECT_GT(half, 0.2 * full);
    EXPECT_LT(half, 0.8 * full);
    EXPECT_EQ(differs(26), 0.0);
}

TEST_F(Tracker, NoEnabledTrackerRefusesTheRun) {
    T::SetNumber(tracker, "Enabled1", 0.0);
    EXPECT_FALSE(Run(0, 3));
    EXPECT_NE(T::ConsoleText(doc).find("Tracker1: No trackers are selected."), std::string::npos)
        << T::ConsoleText(doc);
    EXPECT_FALSE(tracker->FindInput("TrackedCenter1")->Curve());
    EXPECT_TRUE(source->asked.empty()); // nothing rendered
}

} // namespace
} // namespace Orvane
