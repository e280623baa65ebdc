// The modifiers through the engine: Calculation against hand-worked values and its random draw against
// std::mt19937, operands asked at scaled and offset times, Expression's variables, names, _at forms, errors and
// random repeats, XY Path against its formulas worked here, and a driven document rendered, saved and loaded back.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <random>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/InputAt.h"
#include "host/flow/Request.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

namespace T = Orvane::Test;

class Modifiers : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    Operator *Add(const char *cls, const char *name) { return doc.AddTool(OvID(cls), name); }
    /// Output `out` of `op` at `time` (uncached): a number's value, or a point's (x, y).
    static std::pair<double, double> ValueOf(Operator *op, const char *out, double time) {
        EvalOptions o;
        o.useCache = false;
        const Ref<Parameter> v = Evaluate(op->FindOutput(out), time, o);
        if (const auto *n = dynamic_cast<const Number *>(v.Get())) return {n->value, 0.0};
        const auto *p = dynamic_cast<const Point *>(v.Get());
        EXPECT_TRUE(p) << op->Name() << "." << out << " at " << time;
        return p ? std::pair{p->x, p->y} : std::pair{double(NAN), double(NAN)};
    }
    static double NumberOf(Operator *op, const char *out, double time) { return ValueOf(op, out, time).first; }
    static double SeedOf(Operator *op) {
        return dynamic_cast<const Number &>(*op->FindInput("RandomSeed")->ValueAt(0)).value;
    }
    OrvaneDoc doc;
};

/// A tool whose number output is the time it is asked at; it notes the flags of each request.
class TimeProbe : public ThreadedOperator {
public:
    TimeProbe(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        out_ = AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Number}});
    }
    void Process(Request *req) override {
        flags.push_back(req->GetFlags());
        req->SetOutputData(out_, MakeRef<Number>(req->Time()));
    }
    std::vector<uint32_t> flags;

private:
    Output *out_;
};

struct TimeProbeClass {
    OvID id = T::RegisterTestTool("ModifierTimeProbe", &T::MakeTool<TimeProbe>);
};

/// The random draw at time t worked out here: the seed from the time on 64-bit integers, then the top 15 bits of
/// std::mt19937's first output.
int DrawAt(double t) {
    const int64_t a = static_cast<int64_t>(std::trunc(t * 100000));
    const int64_t c = static_cast<int64_t>(std::trunc(static_cast<double>(a ^ 0x78654232) * -t));
    return static_cast<int>(std::mt19937(static_cast<uint32_t>(c ^ 0x74529812))() >> 17);
}

TEST_F(Modifiers, CalculationOperationsGiveHandWorkedValues) {
    Operator *calc = Add("Calculation", "Calc1");
    const struct {
        int op;
        double a, b, want;
    } cases[] = {
        {0, 7, 2, 9},      {1, 7, 2, 5},      {2, 7, 2, 14},  {3, 7, 2, 3.5},    {3, 7, 0, 0},        {4, 2, 7, 3.5},
        {4, 0, 7, 0},      {5, 7, 2, -5},     {6, 7, -2, -2}, {7, 7, -2, 7},     {8, 7, 2, 4.5},      {9, 7, 2, 7},
        {10, 7, 2, 2},     {11, 7, 0, 7},     {12, 7, 0, 0},  {13, 7.5, 2, 1.5}, {13, -7.5, 2, -1.5}, {13, 7, 0, 0},
        {14, 2, 7.5, 1.5}, {14, 0, 7, 0},     {15, 2, 7, 5},  {15, 7, 2, 5},     {16, 2, 10, 1024},   {16, 4, 0.5, 2},
        {17, 10, 2, 1024}, {17, -1, 4, 0.25},
    };
    for (const auto &c : cases) {
        T::SetNumbers(calc, {{"Operator", c.op}, {"FirstOperand", c.a}, {"SecondOperand", c.b}});
        EXPECT_DOUBLE_EQ(NumberOf(calc, "Result", 3.0), c.want) << "operator " << c.op << " on " << c.a << ", " << c.b;
    }
    // The random operations: one draw r of 0..32767 from the time, the same each time the frame is made.
    for (double t : {0.0, 1.0, 12.5, -3.25, 1000.0}) {
        T::SetNumbers(calc, {{"Operator", 11}, {"FirstOperand", 0.25}, {"SecondOperand", 32767}});
        EXPECT_DOUBLE_EQ(NumberOf(calc, "Result", t), DrawAt(t) + 0.25) << t;
        EXPECT_DOUBLE_EQ(NumberOf(calc, "Result", t), DrawAt(t) + 0.25) << t;
        T::SetNumbers(calc, {{"Operator", 12}, {"FirstOperand", 3}, {"SecondOperand", 2}});
        EXPECT_DOUBLE_EQ(NumberOf(calc, "Result", t), 2.0 * DrawAt(t) * 3 / 32767) << t;
    }
    EXPECT_NE(DrawAt(1.0), DrawAt(2.0)); // the draw does change with the time
}

TEST_F(Modifiers, CalculationAsksOperandsAtScaledAndOffsetTimes) {
    const OvID probeClass = T::Once<TimeProbeClass>().id;
    Operator *calc = Add("Calculation", "Calc1");
    auto *first = dynamic_cast<TimeProbe *>(doc.AddTool(probeClass, "P1"));
    auto *second = dynamic_cast<TimeProbe *>(doc.AddTool(probeClass, "P2"));
    ASSERT_TRUE(first && second);
    ASSERT_TRUE(calc->FindInput("FirstOperand")->ConnectTo(first->FindOutput("Value")));
    ASSERT_TRUE(calc->FindInput("SecondOperand")->ConnectTo(second->FindOutput("Value")));
    const struct {
        double scale, offset, time, asked;
    } cases[] = {{1, 0, 5, 5}, {2, 0, 5, 10}, {1, 3, 5, 8}, {0.5, -1, 6, 2}, {-1, 10, 4, 6}, {0, 7, 100, 7}};
    for (const auto &c : cases) {
        T::SetNumbers(calc,
                      {{"Operator", 9}, {"FirstOperandTimeScale", c.scale}, {"FirstOperandTimeOffset", c.offset}});
        first->flags.clear(), second->flags.clear();
        EXPECT_DOUBLE_EQ(NumberOf(calc, "Result", c.time), c.asked) << c.scale << " " << c.offset;
        ASSERT_EQ(first->flags.size(), 1u);
        EXPECT_EQ((first->flags[0] & ReqFlagTimeShifted) != 0, c.scale != 1 || c.offset != 0) << c.scale;
        // The second operand, at scale 1 and offset 0, is asked at the frame's own time, unmarked.
        ASSERT_EQ(second->flags.size(), 1u);
        EXPECT_EQ(second->flags[0] & ReqFlagTimeShifted, 0u);
    }
    EXPECT_EQ(calc->GetTitle(), "Calc1");
    ASSERT_TRUE(Add("Expression", "Expr1")->FindInput("NumberIn1")->ConnectTo(calc->FindOutput("Result")));
    EXPECT_EQ(calc->GetTitle(), "Calculation on Expr1: Number In 1");
}

TEST_F(Modifiers, ExpressionReadsItsInputsNamesAndOtherTimes) {
    Operator *expr = Add("Expression", "Expr1");
    T::SetNumbers(expr, {{"NumberIn1", 3}, {"NumberIn2", -2}, {"NumberIn4", 5}, {"NumberIn9", 0.5}});
    T::SetPoint(expr, "PointIn1", 0.25, 0.75);
    T::SetPoint(expr, "PointIn9", 2, 4);
    ASSERT_TRUE(expr->FindInput("NumberIn3")->SetCurve(T::NumberCurve({{0, 0}, {10, 100}})));
    T::SetText(expr, "NameforNumber2", "speed");
    T::SetText(expr, "NameforNumber4", "sin"); // the language's own names keep their meaning
    T::SetText(expr, "NameforPoint1", "target");
    const struct {
        const char *text;
        double time, want;
    } cases[] = {
        {"n1 + n2 * 2", 0, -1},
        {"n1 ^ 2 + n9", 0, 9.5},
        {"p1x * 4 + p1y", 0, 1.75},
        {"p9x * p9y", 0, 8},
        {"time * 2", 7, 14},
        {"n3", 4, 40}, // the curve at the request's time
        {"n3_at(time - 1)", 4, 30},
        {"n3_at(2.5) + n1_at(99)", 4, 28},
        {"p1y_at(0) - p1x_at(5)", 4, 0.5},
        {"speed * 10 + speed_at(0)", 0, -22},
        {"targetx + targety_at(1)", 0, 1},
        {"sin(0) + n4", 0, 5},
        {"if(n1 > 2, 1, 0) + min(n1, n2, 5)", 0, -1},
        {"", 0, 0},
        {"n1 +", 0, 0}, // does not read: 0 and a line
    };
    for (const auto &c : cases) {
        T::SetText(expr, "NumberExpression", c.text);
        EXPECT_DOUBLE_EQ(NumberOf(expr, "NumberResult", c.time), c.want) << c.text;
    }
    EXPECT_NE(T::ConsoleText(doc).find("Expr1: Number Expression, column 5: "), std::string::npos);
    T::SetText(expr, "PointExpressionX", "p1x + n1");
    T::SetText(expr, "PointExpressionY", "time");
    EXPECT_EQ(ValueOf(expr, "PointResult", 6), std::pair(3.25, 6.0));

    // rand() repeats for a seed and frame, and changes with either; Reseed picks another seed.
    T::SetText(expr, "NumberExpression", "rand()");
    const double r5 = NumberOf(expr, "NumberResult", 5), seed = SeedOf(expr);
    EXPECT_TRUE(r5 >= 0 && r5 < 1) << r5;
    EXPECT_EQ(NumberOf(expr, "NumberResult", 5), r5);
    EXPECT_NE(NumberOf(expr, "NumberResult", 6), r5);
    T::SetNumber(expr, "Randomize", 1);
    EXPECT_NE(SeedOf(expr), seed);
    EXPECT_NE(NumberOf(expr, "NumberResult", 5), r5);
}

TEST_F(Modifiers, XYPathPlacesAndHeadsAsWorkedHere) {
    Operator *path = Add("XYPath", "Path1");
    const struct {
        double x, y, size, angle, cx, cy, r;
    } cases[] = {{0.7, 0.2, 1, 0, 0.5, 0.5, 1},
                 {0.9, 0.1, 0, 33, 0.3, 0.6, 1},
                 {0.8, 0.5, 2, 90, 0.5, 0.5, 1},
                 {0.6, 0.9, 1.5, 30, 0.1, 0.2, 2},
                 {0.25, 0.75, 0.7, -45, 0, 0, 0.5}};
    for (const auto &c : cases) {
        T::SetNumbers(path, {{"X", c.x}, {"Y", c.y}, {"Size", c.size}, {"Angle", c.angle}});
        T::SetPoint(path, "Center", c.cx, c.cy);
        path->KeptFields().Set("r", c.r);
        const double a = static_cast<float>(c.angle) * std::numbers::pi / 180, s = static_cast<float>(c.size);
        const double dx = (c.x - 0.5) * s, dy = (c.y - 0.5) * s * c.r;
        const auto [px, py] = ValueOf(path, "Value", 0);
        EXPECT_NEAR(px, dx * std::cos(a) - dy * std::sin(a) + c.cx, 1e-12) << c.angle;
        EXPECT_NEAR(py, (dy * std::cos(a) + dx * std::sin(a)) / c.r + c.cy, 1e-12) << c.angle;
        EXPECT_TRUE(c.size != 0 || (px == c.cx && py == c.cy)) << "size 0 gives the centre";
    }
    // Heading: from (0, 0) at frame 0 to (1, 2) at frame 10, aspect 2, Angle 10 and offset 5; still beyond the keys.
    path->KeptFields().Set("r", 2.0);
    T::SetNumbers(path, {{"Angle", 10}, {"HeadingOffset", 5}});
    ASSERT_TRUE(path->FindInput("X")->SetCurve(T::NumberCurve({{0, 0}, {10, 1}})));
    ASSERT_TRUE(path->FindInput("Y")->SetCurve(T::NumberCurve({{0, 0}, {10, 2}})));
    const double moving = std::atan2(0.2 * 2, 0.1) * 180 / std::numbers::pi + 15;
    for (double t : {0.0, 0.2, 5.0, 9.9, 10.0}) EXPECT_NEAR(NumberOf(path, "Heading", t), moving, 1e-9) << t;
    EXPECT_DOUBLE_EQ(NumberOf(path, "Heading", 12), 15);
    T::SetNumbers(path, {{"X", 0.3}, {"Y", 0.3}});
    EXPECT_DOUBLE_EQ(NumberOf(path, "Heading", 5), 15);
}

// Transform's Angle and Center driven by modifiers render as the same Transform with the values worked out here.
TEST_F(Modifiers, DrivenDocumentsRenderSaveAndLoadBack) {
    const char *text = R"(Orvane.Document { Tools = {
        Calc1 = Calculation { Inputs = { FirstOperand = Curve { { 0, 0 }, { 10, 90 } }, Operator = 9 } },
        Expr1 = Expression { Inputs = { NumberIn1 = Calc1.Result, NumberExpression = "n1 * 2",
                                        NameforNumber1 = "angle" } },
        Path1 = XYPath { Inputs = { X = Curve { { 0, 0.25 }, { 10, 0.75 } }, DrawMode = 2 }, r = 2 },
        Plate = Background { Inputs = { Type = "FourCorner", TopLeftRed = 1, BottomRightBlue = 1, Width = 48,
                                        Height = 32 } },
        Spin = Transform { Inputs = { Center = Path1.Value, Angle = Calc1.Result, Input = Plate.Output } },
        Twice = Transform { Inputs = { Angle = Expr1.NumberResult, Input = Plate.Output } },
    } })";
    const DocumentLoadResult loaded = LoadDocument(text, doc);
    ASSERT_TRUE(loaded.ok) << loaded.error;
    // At frame 4 the angle arrives as 36 degrees (72 through the expression), the centre as (0.45, 0.5).
    Operator *fixed = Add("Transform", "Fixed");
    ASSERT_TRUE(fixed->FindInput("Input")->ConnectTo(doc.FindTool("Plate")->FindOutput("Output")));
    for (const auto &[tool, angle, cx] : {std::tuple{"Spin", 36.0, 0.45}, {"Twice", 72.0, 0.5}}) {
        T::SetNumber(fixed, "Angle", angle);
        T::SetPoint(fixed, "Center", cx, 0.5);
        const Ref<Image> driven = T::EvalImage(doc.FindTool(tool), 4), want = T::EvalImage(fixed, 4);
        ASSERT_TRUE(driven && want && driven->DataWindow() == want->DataWindow()) << tool;
        for (int y = 0; y < 32; y += 3)
            for (int x = 0; x < 48; x += 5) T::ExpectPixelNear(driven->GetFlt(x, y), want->GetFlt(x, y), 1e-5, tool);
    }
    EXPECT_EQ(doc.FindTool("Expr1")->GetTitle(), "Expr1 on Twice: Angle");

    // Saved and loaded back, the document is the same, its links and the path's aspect among it.
    ASSERT_TRUE(doc.RemoveTool("Fixed"));
    const std::string saved = SaveDocument(doc);
    for (const char *part : {"Angle = Calc1.Result", "Angle = Expr1.NumberResult", "Center = Path1.Value", "r = 2",
                             "NameforNumber1 = \"angle\""})
        EXPECT_NE(saved.find(part), std::string::npos) << part << "\n" << saved;
    OrvaneDoc again;
    ASSERT_TRUE(LoadDocument(saved, again).ok);
    EXPECT_EQ(SaveDocument(again), saved);
}

} // namespace
} // namespace Orvane
