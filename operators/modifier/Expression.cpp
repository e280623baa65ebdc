#include "operators/modifier/Expression.h"

#include <fmt/format.h>

#include <cctype>
#include <cmath>
#include <cstring>
#include <new>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputAt.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/script/Parser.h"
#include "host/script/ScriptState.h"
#include "operators/frame/Registration.h"
#include "operators/modifier/Modifier.h"
#include "operators/modifier/VariableFields.h"

namespace Orvane {

static const OvID CLSID_Expression("Expression");
static ClassRegistration<Expression, ThreadedOperator>
    s_Registration(CLSID_Expression, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindModifier},
                    {RegClassName, "Expression"},
                    {RegPath, "Tools/Modifiers/Expression"},
                    {RegName, "Expression"},
                    {RegHelp, "Drives a number and a point from expressions over its inputs"},
                    {RegOutputType, "Number"}});

namespace {

TagList Page(const char *icon) { return {{PageIcon, static_cast<const void *>(icon)}}; }

TagList TextTags() {
    return {{LinkDataType, CLSID_DataType_Text}, {InputControl, CLSID_InputControl_TextEdit}, {InputDefaultText, ""}};
}

bool Pressed(const Parameter *param) {
    const auto *n = dynamic_cast<const Number *>(param);
    return n && n->value >= 0.5;
}

/// The seed of Lua's generator for a random seed and a time: both mixed (splitmix64's finaliser) and cut to the 53
/// bits a double holds exactly, so that every seed and frame has its own sequence.
double LuaSeed(double seed, double time) {
    uint64_t bits;
    std::memcpy(&bits, &time, sizeof bits);
    uint64_t z = bits ^ (static_cast<uint64_t>(static_cast<int64_t>(seed)) * 0x9e3779b97f4a7c15ull);
    z = (z ^ (z >> 30)) * 0xbf58476d1ce4e5b9ull;
    z = (z ^ (z >> 27)) * 0x94d049bb133111ebull;
    z ^= z >> 31;
    return static_cast<double>(z >> 11);
}

constexpr int kMaxSeed = 32767;

} // namespace

Expression::Expression(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", Page("Icons.Tools.Tabs.Expression"));
    for (int k = 1; k <= kInputs; ++k)
        numberIn_[k - 1] = AddInputTagList(
            fmt::format("Number In {}", k).c_str(), fmt::format("NumberIn{}", k).c_str(),
            {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Screw}, {InputDefault, 0.0}});
    for (int k = 1; k <= kInputs; ++k)
        pointIn_[k - 1] = AddInputTagList(fmt::format("Point In {}", k).c_str(), fmt::format("PointIn{}", k).c_str(),
                                          {{LinkDataType, CLSID_DataType_Point},
                                           {InputControl, CLSID_InputControl_Offset},
                                           {PreviewControl, CLSID_PreviewControl_Crosshair},
                                           {InputDefaultX, 0.5},
                                           {InputDefaultY, 0.5}});

    AddControlPageTagList("Number Out", Page("Icons.Tools.Tabs.NumberOut"));
    numberExpr_ = AddInputTagList("Number Expression", "NumberExpression", TextTags());
    AddControlPageTagList("Point Out", Page("Icons.Tools.Tabs.PointOut"));
    pointExprX_ = AddInputTagList("Point Expression X", "PointExpressionX", TextTags());
    pointExprY_ = AddInputTagList("Point Expression Y", "PointExpressionY", TextTags());

    AddControlPageTagList("Config", Page("Icons.Tools.Tabs.Config"));
    randomSeed_ = AddInputTagList("Random Seed", "RandomSeed",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {InputInteger, 1},
                                   {InputMinAllowed, 0.0},
                                   {InputMaxAllowed, double(kMaxSeed)},
                                   {InputDefault, 0.0}});
    randomize_ = AddInputTagList("Reseed", "Randomize",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Button},
                                  {InputExternal, 0},
                                  {InputNotify, 1},
                                  {InputInitialNotify, 0},
                                  {InputPassive, 1}});
    numberFields_.Add(this, "Number", {numberIn_, numberIn_ + kInputs});
    pointFields_.Add(this, "Point", {pointIn_, pointIn_ + kInputs});

    numberResult_ = AddOutputTagList("Number Result", "NumberResult", {{LinkDataType, CLSID_DataType_Number}});
    pointResult_ = AddOutputTagList("Point Result", "PointResult", {{LinkDataType, CLSID_DataType_Point}});
}

Expression::~Expression() = default;

void Expression::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == randomize_ && Pressed(param)) {
        // A new seed, never the one in use, so that every press changes the draws.
        const Ref<Parameter> current = randomSeed_->ValueAt(time);
        const auto *old = dynamic_cast<const Number *>(current.Get());
        randomSeed_->SetValue(MakeRef<Number>(NewRandomSeed(old ? old->value : -1)));
    }
    numberFields_.Notify(in, param) || pointFields_.Notify(in, param);
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

template <int Axis> double Expression::InputAt(void *self, const double *args, int count) {
    auto *tool = static_cast<Expression *>(self);
    const int k = count == 2 ? static_cast<int>(args[0]) : 0;
    if (k < 1 || k > kInputs) return 0.0;
    if (Axis < 0) return InputNumberAt(tool->current_, tool->numberIn_[k - 1], args[1], 0.0);
    double xy[2];
    InputPointAt(tool->current_, tool->pointIn_[k - 1], args[1], xy[0], xy[1]);
    return xy[Axis];
}

bool Expression::Prepare(Request *req) {
    const std::string texts[3] = {TextOf(req, numberExpr_), TextOf(req, pointExprX_), TextOf(req, pointExprY_)};
    std::string key;
    for (const std::string &t : texts) key += t + '\x1f';
    const std::vector<std::string> numberNames = numberFields_.Names(req), pointNames = pointFields_.Names(req);
    for (int k = 0; k < kInputs; ++k) key += numberNames[k] + '\x1f' + pointNames[k] + '\x1f';
    const NameAliases aliases = InputNameAliases(numberNames, pointNames, true, false);
    if (!state_) {
        try {
            state_ = std::make_unique<ScriptState>();
        } catch (const std::bad_alloc &) {
            Fail(req, "%s: no script state could be made for the expressions\n", Name().c_str());
            return false;
        }
        state_->SetFunction(ScriptEnv::Sandbox, "_numat", &Expression::InputAt<-1>, this);
        state_->SetFunction(ScriptEnv::Sandbox, "_ptxat", &Expression::InputAt<0>, this);
        state_->SetFunction(ScriptEnv::Sandbox, "_ptyat", &Expression::InputAt<1>, this);
    } else if (key == loaded_) {
        return true;
    }

    // An expression that does not read gives 0, with one console line saying where it failed.
    static const char *const labels[3] = {"Number Expression", "Point Expression X", "Point Expression Y"};
    Parser parser;
    std::string lua[3];
    for (int i = 0; i < 3; ++i) {
        ParseError error;
        if (texts[i].find_first_not_of(" \t\r\n") == std::string::npos) {
            lua[i] = "0";
        } else if (!parser.Parse(texts[i], ExpressionContext::Number, &lua[i], &error, &aliases)) {
            if (GetDoc())
                GetDoc()->PrintF(req, ConsoleError, "%s: %s, %s\n", Name().c_str(), labels[i],
                                 error.Describe().c_str());
            lua[i] = "0";
        }
    }
    const std::string script = Parser::LuaPrelude() + "function _ExprNumber(seed)\n  math.randomseed(seed)\n  return " +
                               lua[0] + "\nend\nfunction _ExprPoint(seed)\n  math.randomseed(seed)\n  return " +
                               lua[1] + ", " + lua[2] + "\nend\n";
    const std::string error = state_->Run(ScriptEnv::Sandbox, script, "expressions");
    if (!error.empty()) {
        loaded_.clear();
        Fail(req, "%s: %s\n", Name().c_str(), error.c_str());
        return false;
    }
    loaded_ = key;
    return true;
}

void Expression::Process(Request *req) {
    Output *asked = req->AskedOutput() == pointResult_ ? pointResult_ : numberResult_;
    if (!Prepare(req)) {
        req->SetOutputData(asked, nullptr);
        return;
    }
    ScriptState &s = *state_;
    for (int k = 1; k <= kInputs; ++k) {
        s.SetNumber(ScriptEnv::Sandbox, fmt::format("n{}", k).c_str(), req->GetInputNumber(numberIn_[k - 1], 0.0));
        const auto *p = dynamic_cast<const Point *>(req->GetInputData(pointIn_[k - 1]));
        s.SetNumber(ScriptEnv::Sandbox, fmt::format("p{}x", k).c_str(), p ? p->x : 0.5);
        s.SetNumber(ScriptEnv::Sandbox, fmt::format("p{}y", k).c_str(), p ? p->y : 0.5);
    }
    s.SetNumber(ScriptEnv::Sandbox, "time", req->Time());
    s.SetNumber(ScriptEnv::Sandbox, "_seed", LuaSeed(req->GetInputNumber(randomSeed_, 0.0), req->Time()));

    current_ = req;
    const bool point = asked == pointResult_;
    const std::string error =
        s.Run(ScriptEnv::Sandbox, point ? "_rx, _ry = _ExprPoint(_seed)" : "_rn = _ExprNumber(_seed)", "evaluation");
    current_ = nullptr;
    if (!error.empty()) {
        Fail(req, "%s: %s at time %g: %s\n", Name().c_str(), point ? "Point Result" : "Number Result", req->Time(),
             error.c_str());
        req->SetOutputData(asked, nullptr);
        return;
    }
    if (point)
        req->SetOutputData(pointResult_, MakeRef<Point>(s.GetNumber(ScriptEnv::Sandbox, "_rx"),
                                                        s.GetNumber(ScriptEnv::Sandbox, "_ry")));
    else
        req->SetOutputData(numberResult_, MakeRef<Number>(s.GetNumber(ScriptEnv::Sandbox, "_rn")));
}

std::string Expression::GetTitle() const {
    const std::string title = DrivenTitle(Name(), {numberResult_, pointResult_});
    return title.empty() ? Name() : title;
}

} // namespace Orvane
