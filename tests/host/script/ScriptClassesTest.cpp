// Script classes: each way a class hands functions to a trusted script (pointers, names, snippets, Lua C
// functions, getters, constants), objects freed when the script drops them, and images scripts make.
#include <gtest/gtest.h>

#include <algorithm>

#include <lua.hpp>

#include "host/script/ScriptClasses.h"
#include "host/script/ScriptState.h"

namespace Orvane {
namespace {

struct Counter : ScriptObject {
    int count = 0;
    static inline int live = 0;
    Counter() { ++live; }
    ~Counter() override { --live; }
};

extern "C" {
Counter *TestCounterNew() { return new Counter(); }
int TestCounterAdd(Counter *c, int n) { return c->count += n; }
int TestCounterGet(Counter *c) { return c->count; }
}
void TestCounterFree(void *c) { delete static_cast<Counter *>(c); }

int TestCounterPeek(lua_State *L) {
    auto *c = static_cast<Counter *>(ScriptObjectArgument(L, 1));
    lua_pushnumber(L, c ? c->count * 1000 + lua_tonumber(L, 2) : -1);
    return 1;
}

void RegisterCounter() {
    ScriptClass c;
    c.name = "Counter";
    c.declarations = "typedef struct Counter Counter;";
    using F = ScriptClassFunction;
    c.functions = {
        {"new", "Counter * TestCounterNew()", "TestCounterNew", reinterpret_cast<void *>(&TestCounterNew), F::Static,
         false, TestCounterFree},
        {"Add", "int TestCounterAdd(Counter *c, int n)", "TestCounterAdd", reinterpret_cast<void *>(&TestCounterAdd)},
        {"Count", "int TestCounterGet(Counter *c)", "TestCounterGet", reinterpret_cast<void *>(&TestCounterGet),
         F::Getter},
        // No address: found by name among the process's symbols (the host library's pixel API).
        {"Width", "int32_t ovs_ImageWidth(const Image *img)", "ovs_ImageWidth", nullptr, F::Static},
    };
    c.snippets = {{"Twice(self, n)", "self:Add(n)\nreturn self:Add(n)"}};
    c.cFunctions = {{"Peek", TestCounterPeek}};
    c.numbers = {{"STEP", 5}};
    c.texts = {{"KIND", "counter"}};
    RegisterScriptClass(std::move(c));
}

TEST(ScriptClasses, TrustedScriptsUseEveryKindOfBindingAndObjectsAreFreed) {
    RegisterCounter();
    ScriptState s;
    ASSERT_EQ(InstallScriptClasses(s), "");
    EXPECT_EQ(InstallScriptClasses(s), ""); // a second installation keeps the first
    ASSERT_EQ(s.Run(ScriptEnv::Trusted, R"(
        local c = Counter.new()
        c:Add(Counter.STEP)
        twice = c:Twice(3)
        count, kind, fromObject = c.Count, Counter.KIND, c.STEP
        peek = c:Peek(7)
        local img = Image.New(7, 3)
        width, height, missing = Counter.Width(img), img.Height, Image.New(0, 3) == nil
        Image.Free(img)
    )"),
              "");
    const auto n = [&](const char *name) { return s.GetNumber(ScriptEnv::Trusted, name, -1); };
    EXPECT_EQ(n("twice"), 11);
    EXPECT_EQ(n("count"), 11);
    EXPECT_EQ(n("fromObject"), 5);
    EXPECT_EQ(n("peek"), 11007);
    EXPECT_EQ(n("width"), 7);
    EXPECT_EQ(n("height"), 3);
    EXPECT_EQ(s.Run(ScriptEnv::Trusted, "assert(kind == 'counter' and missing == true)"), "");
    EXPECT_EQ(s.Run(ScriptEnv::Trusted, "collectgarbage() collectgarbage()"), "");
    EXPECT_EQ(Counter::live, 0);
    // Classes and script-made images are for trusted scripts only.
    EXPECT_EQ(s.Run(ScriptEnv::Sandbox, "assert(Counter == nil and Image == nil)"), "");
    const std::vector<std::string> names = ScriptClassNames();
    EXPECT_NE(std::find(names.begin(), names.end(), "Counter"), names.end());
}

TEST(ScriptClasses, BadRegistrationsAreReportedNotRun) {
    ScriptClass c;
    c.name = "Broken";
    c.declarations = "typedef struct Broken Broken;";
    c.snippets = {{"no parameter list", "return 1"}};
    RegisterScriptClass(c);
    ScriptState s;
    const std::string error = InstallScriptClasses(s);
    EXPECT_NE(error.find("Broken: "), std::string::npos) << error;
    c.snippets.clear();
    RegisterScriptClass(c); // replaces the broken one
    ScriptState t;
    EXPECT_EQ(InstallScriptClasses(t), "");
}

} // namespace
} // namespace Orvane
