#include "host/script/ScriptState.h"

#include <cstdlib>
#include <new>
#include <stdexcept>

#include <fmt/format.h>

extern "C" {
#include <lauxlib.h>
#include <lua.h>
#include <luajit.h>
#include <lualib.h>
}

#include "host/image/Pixel.h"
#include "host/script/ScriptImageApi.h"

namespace Orvane {

// The host binding, run once in the trusted globals with the function table and
// the C declarations. It binds the FFI types, puts the pixel API into both
// environments, builds the sandbox table and returns the helpers the host calls.
static const char *const kScriptBinding = R"(
local apiAddress, declarations, limited, floatDepth = ...
local ffi = require("ffi")
ffi.cdef(declarations)
-- The cursor's fields, for this binding only: scripts hold cursors as opaque constant bytes.
ffi.cdef[[typedef struct PixPtrView {
    void *img; uint8_t *row; int32_t x, y, x0, x1, bytesPerPixel, depth, writable; uint32_t auxFields;
} PixPtrView;]]
local PixPtrView, FloatRow = ffi.typeof("PixPtrView *"), ffi.typeof("float *")
local api = ffi.cast("const OrvaneScriptApi *", apiAddress)
local FltPixelType, PixPtrType = ffi.typeof("FltPixel"), ffi.typeof("PixPtr")
local pixelBytes = ffi.sizeof(FltPixelType)

ffi.metatype(FltPixelType, { __index = {
    Clear = function(p) ffi.fill(p, pixelBytes) end,
    Set = function(p, q) ffi.copy(p, q, pixelBytes) end,
} })
-- Stepping through float RGBA rows without auxiliary channels stays in Lua (the compiler turns it into
-- plain loads and stores); every other case, and every check that fails, goes to the host's functions.
local function FloatPixelAt(v)
    local x = v.x
    if v.depth == floatDepth and v.auxFields == 0 and v.row ~= nil and x >= v.x0 and x < v.x1 then
        return ffi.cast(FloatRow, v.row) + (x - v.x0) * 4
    end
    return nil
end
ffi.metatype(PixPtrType, { __index = {
    GotoXY = function(pp, x, y) api.PixPtrGotoXY(pp, x, y) end,
    NextPixel = function(pp) api.PixPtrNextPixel(pp) end,
    GetPixel = function(pp, p) api.PixPtrGetPixel(pp, p) end,
    SetPixel = function(pp, p) api.PixPtrSetPixel(pp, p) end,
    GetNextPixel = function(pp, p)
        local v = ffi.cast(PixPtrView, pp)
        local f = FloatPixelAt(v)
        if f == nil or not ffi.istype(FltPixelType, p) then return api.PixPtrGetNextPixel(pp, p) end
        p.R, p.G, p.B, p.A = f[0], f[1], f[2], f[3]
        v.x = v.x + 1
    end,
    SetNextPixel = function(pp, p)
        local v = ffi.cast(PixPtrView, pp)
        local f = FloatPixelAt(v)
        if f == nil or v.writable == 0 or not ffi.istype(FltPixelType, p) then return api.PixPtrSetNextPixel(pp, p) end
        f[0], f[1], f[2], f[3] = p.R, p.G, p.B, p.A
        v.x = v.x + 1
    end,
} })
local imageFields = { Width = api.ImageWidth, Height = api.ImageHeight, XScale = api.ImageXScale, YScale = api.ImageYScale }
local imageMethods = {
    SamplePixelB = function(img, x, y, p) api.ImageSample(img, x, y, 0, p) end,
    SamplePixelW = function(img, x, y, p) api.ImageSample(img, x, y, 1, p) end,
    SamplePixelD = function(img, x, y, p) api.ImageSample(img, x, y, 2, p) end,
    SamplePixelM = function(img, x, y, p) api.ImageSample(img, x, y, 3, p) end,
    GetCanvasColorFlt = function(img, p) api.ImageGetCanvasColorFlt(img, p) end,
}
ffi.metatype("Image", { __index = function(img, key)
    local field = imageFields[key]
    if field then return field(img) end
    return imageMethods[key]
end })

local function MPDispatch(chunkfunc, initfunc, lines, counter, abort)
    if initfunc then initfunc() end
    while api.Aborted(abort) == 0 do
        local y = api.NextLine(counter)
        if y >= lines then break end
        chunkfunc(y)
    end
end

local pixelApi = {
    FltPixel = function() return FltPixelType() end,
    -- The second argument, the pixel a cursor is used with, is not needed by the cursor.
    PixPtr = function(img, _) local pp = PixPtrType() api.PixPtrInit(pp, img) return pp end,
    _MPDispatch = MPDispatch,
}

local function copy(t, drop)
    local c = {}
    for k, v in pairs(t) do if not (drop and drop[k]) then c[k] = v end end
    return c
end
local safeString = copy(string, { dump = true })
getmetatable("").__index = safeString
local sandbox = { math = copy(math), bit = copy(bit), string = copy(safeString), table = copy(table) }
for _, name in ipairs({ "assert", "error", "ipairs", "next", "pairs", "select", "tonumber", "tostring", "type", "unpack" }) do
    sandbox[name] = _G[name]
end
for name, value in pairs(pixelApi) do sandbox[name] = value; _G[name] = value end
-- Pixel templates size and copy pixels and tune the compiler; the sandbox gets those calls alone.
sandbox.ffi = {
    sizeof = function(t)
        if t == "FltPixel" or ffi.istype(FltPixelType, t) then return pixelBytes end
        error("ffi.sizeof takes FltPixel only here", 2)
    end,
    copy = function(to, from)
        if not (ffi.istype(FltPixelType, to) and ffi.istype(FltPixelType, from)) then
            error("ffi.copy copies pixels only here", 2)
        end
        ffi.copy(to, from, pixelBytes)
    end,
}
sandbox.jit = { flush = function() jit.flush() end, opt = { start = function(...) jit.opt.start(...) end } }
_G.ffi = ffi
-- Images a trusted script makes itself (to fill and hand to a script class): released when the
-- script drops them, or at once with Image.Free.
_G.Image = {
    New = function(width, height, depth)
        local img = api.ImageNew(width, height, depth or 8)
        if img == nil then return nil end
        return ffi.gc(img, api.ImageFree)
    end,
    Free = function(img)
        if img ~= nil then ffi.gc(img, nil); api.ImageFree(img) end
    end,
}
if limited then jit.on = function() error("the JIT compiler stays off in a state with limits", 2) end end

return {
    sandbox = sandbox,
    setPointer = function(env, name, ctype, address)
        if address == nil then env[name] = nil else env[name] = ffi.cast(ctype, address) end
    end,
    dispatch = function(env, lines, counter, abort)
        return rawget(env, "_MPDispatch")(rawget(env, "chunkfunc"), rawget(env, "initfunc"), lines,
                                          ffi.cast("int32_t *", counter), ffi.cast("const int32_t *", abort))
    end,
}
)";

namespace {
char g_implKey;
}

struct ScriptState::Impl {
    lua_State *L = nullptr;
    ScriptLimits limits;
    AlertFn alert;
    const int32_t *abort = nullptr;
    int bindingRef = LUA_NOREF;
    bool ownAllocator = false;
    bool enforcing = false;  // the memory limit holds only while script code runs
    size_t used = 0;         // bytes held, counted by the allocator
    uint64_t budget = 0;     // hook periods allowed in this call; 0: unbounded
    uint64_t periods = 0;    // hook periods used in this call
    std::string stopMessage; // set once the hook stopped the call

    static Impl *Of(lua_State *L) {
        lua_pushlightuserdata(L, &g_implKey);
        lua_rawget(L, LUA_REGISTRYINDEX);
        auto *s = static_cast<Impl *>(lua_touserdata(L, -1));
        lua_pop(L, 1);
        return s;
    }

    size_t MemoryUsed() const { return size_t(lua_gc(L, LUA_GCCOUNT, 0)) * 1024 + size_t(lua_gc(L, LUA_GCCOUNTB, 0)); }

    /// Stops the running call; from here on every instruction raises the error again, so a
    /// script that catches it unwinds to the host.
    [[noreturn]] void Stop(std::string message) {
        stopMessage = std::move(message);
        lua_sethook(L, CountHook, LUA_MASKCOUNT, 1);
        luaL_error(L, "%s", stopMessage.c_str());
        std::abort(); // luaL_error does not return
    }

    static void CountHook(lua_State *L, lua_Debug *) {
        Impl *s = Of(L);
        if (!s->stopMessage.empty()) luaL_error(L, "%s", s->stopMessage.c_str());
        if (ovs_Aborted(s->abort)) s->Stop(kScriptAbortedMessage);
        if (s->budget && ++s->periods > s->budget)
            s->Stop(fmt::format("instruction limit of {} reached", s->budget * kHookPeriod));
        if (!s->ownAllocator && s->limits.memoryBytes && s->MemoryUsed() > s->limits.memoryBytes)
            s->Stop(fmt::format("memory limit of {} MiB reached", s->limits.memoryBytes >> 20));
    }

    static void *Allocate(void *ud, void *ptr, size_t oldSize, size_t newSize) {
        auto *s = static_cast<Impl *>(ud);
        if (newSize == 0) {
            std::free(ptr);
            s->used -= oldSize;
            return nullptr;
        }
        if (s->enforcing && s->limits.memoryBytes && newSize > oldSize &&
            s->used - oldSize + newSize > s->limits.memoryBytes)
            return nullptr;
        void *p = std::realloc(ptr, newSize);
        if (p) s->used = s->used - oldSize + newSize;
        return p;
    }

    /// The body of every SetFunction closure; upvalue 1 is its HostFunction.
    struct HostFunction {
        NumberFunction fn;
        void *data;
    };
    static int CallHostFunction(lua_State *L) {
        const auto *f = static_cast<const HostFunction *>(lua_touserdata(L, lua_upvalueindex(1)));
        const int count = lua_gettop(L);
        if (count > kMaxFunctionArgs) return luaL_error(L, "too many arguments (at most %d)", kMaxFunctionArgs);
        double args[kMaxFunctionArgs] = {};
        for (int i = 0; i < count; ++i) args[i] = luaL_checknumber(L, i + 1);
        double result = 0;
        bool failed = false;
        try {
            result = f->fn(f->data, args, count);
        } catch (...) {
            failed = true; // luaL_error is raised outside the handler, so no C++ frame is skipped
        }
        if (failed) return luaL_error(L, "a host function failed");
        lua_pushnumber(L, result);
        return 1;
    }

    static int Alert(lua_State *L) {
        Impl *s = static_cast<Impl *>(lua_touserdata(L, lua_upvalueindex(1)));
        const char *text = lua_isstring(L, 1) ? lua_tostring(L, 1) : luaL_typename(L, 1);
        if (s->alert) s->alert(text);
        return 0;
    }

    /// Arms the hook for one call in `env`.
    void Arm(ScriptEnv env) {
        const uint64_t instructions =
            env == ScriptEnv::Sandbox ? limits.sandboxInstructions : limits.trustedInstructions;
        budget = limits.jit ? 0 : (instructions + kHookPeriod - 1) / kHookPeriod;
        periods = 0;
        stopMessage.clear();
        const bool hook = !limits.jit && (budget || abort || (!ownAllocator && limits.memoryBytes));
        lua_sethook(L, hook ? CountHook : nullptr, hook ? LUA_MASKCOUNT : 0, kHookPeriod);
        enforcing = true;
    }

    /// Disarms after a call and turns its status into the error text (empty: none).
    std::string Finish(int status) {
        enforcing = false;
        lua_sethook(L, nullptr, 0, 0);
        std::string error;
        if (status == LUA_ERRMEM && limits.memoryBytes)
            error = fmt::format("memory limit of {} MiB reached", limits.memoryBytes >> 20);
        else if (status != 0)
            error = lua_isstring(L, -1) ? lua_tostring(L, -1) : "(error object is not a string)";
        if (status != 0) {
            lua_pop(L, 1);
            lua_gc(L, LUA_GCCOLLECT, 0);
        }
        stopMessage.clear();
        return error;
    }
};

ScriptState::ScriptState(const ScriptLimits &limits) : impl_(std::make_unique<Impl>()) {
    Impl &s = *impl_;
    s.limits = limits;
    // Builds without 64-bit GC references refuse a custom allocator; the count hook then
    // checks the collector's count instead.
    s.L = lua_newstate(Impl::Allocate, &s);
    s.ownAllocator = s.L != nullptr;
    if (!s.L) s.L = luaL_newstate();
    if (!s.L) throw std::bad_alloc();
    lua_State *L = s.L;
    luaL_openlibs(L);
    if (!limits.jit) luaJIT_setmode(L, 0, LUAJIT_MODE_ENGINE | LUAJIT_MODE_OFF);
    lua_pushlightuserdata(L, &g_implKey);
    lua_pushlightuserdata(L, &s);
    lua_rawset(L, LUA_REGISTRYINDEX);

    if (luaL_loadbuffer(L, kScriptBinding, std::char_traits<char>::length(kScriptBinding), "=binding") != 0 ||
        (lua_pushlightuserdata(L, const_cast<OrvaneScriptApi *>(&ScriptImageApi())),
         lua_pushstring(L, ScriptImageDeclarations()), lua_pushboolean(L, !limits.jit),
         lua_pushnumber(L, DepthRGBAFlt32), lua_pcall(L, 4, 1, 0) != 0)) {
        lua_close(L);
        throw std::bad_alloc();
    }
    s.bindingRef = luaL_ref(L, LUA_REGISTRYINDEX);
    for (ScriptEnv env : {ScriptEnv::Sandbox, ScriptEnv::Trusted}) {
        PushEnv(env);
        lua_pushlightuserdata(L, &s);
        lua_pushcclosure(L, Impl::Alert, 1);
        lua_setfield(L, -2, "_ALERT");
        lua_pop(L, 1);
    }
}

ScriptState::~ScriptState() { lua_close(impl_->L); }

void ScriptState::SetAlert(AlertFn fn) { impl_->alert = std::move(fn); }
void ScriptState::SetAbortWord(const int32_t *abort) { impl_->abort = abort; }
lua_State *ScriptState::Lua() const { return impl_->L; }
const ScriptLimits &ScriptState::Limits() const { return impl_->limits; }
size_t ScriptState::MemoryUsed() const { return impl_->MemoryUsed(); }

void ScriptState::PushBindingFunction(const char *name) const {
    lua_rawgeti(impl_->L, LUA_REGISTRYINDEX, impl_->bindingRef);
    lua_getfield(impl_->L, -1, name);
    lua_remove(impl_->L, -2);
}

void ScriptState::PushEnv(ScriptEnv env) const {
    if (env == ScriptEnv::Trusted)
        lua_pushvalue(impl_->L, LUA_GLOBALSINDEX);
    else
        PushBindingFunction("sandbox");
}

std::string ScriptState::Run(ScriptEnv env, std::string_view text, std::string_view chunkName) {
    lua_State *L = impl_->L;
    // Bytecode skips the compiler's checks and can break memory safety.
    if (!text.empty() && text[0] == LUA_SIGNATURE[0])
        return fmt::format("{}: binary chunks are not accepted", chunkName);
    const std::string name = fmt::format("={}", chunkName);
    impl_->enforcing = true;
    const int loaded = luaL_loadbuffer(L, text.data(), text.size(), name.c_str());
    if (loaded != 0) return impl_->Finish(loaded);
    if (env == ScriptEnv::Sandbox) {
        PushEnv(env);
        lua_setfenv(L, -2);
    }
    return CallOnStack(env, 0);
}

std::string ScriptState::CallOnStack(ScriptEnv env, int nargs) {
    impl_->Arm(env);
    return impl_->Finish(lua_pcall(impl_->L, nargs, 0, 0));
}

void ScriptState::SetNumber(ScriptEnv env, const char *name, double value) {
    PushEnv(env);
    lua_pushnumber(impl_->L, value);
    lua_setfield(impl_->L, -2, name);
    lua_pop(impl_->L, 1);
}

void ScriptState::SetFunction(ScriptEnv env, const char *name, NumberFunction fn, void *data) {
    lua_State *L = impl_->L;
    PushEnv(env);
    auto *f = static_cast<Impl::HostFunction *>(lua_newuserdata(L, sizeof(Impl::HostFunction)));
    *f = {fn, data};
    lua_pushcclosure(L, Impl::CallHostFunction, 1);
    lua_setfield(L, -2, name);
    lua_pop(L, 1);
}

void ScriptState::SetString(ScriptEnv env, const char *name, std::string_view value) {
    PushEnv(env);
    lua_pushlstring(impl_->L, value.data(), value.size());
    lua_setfield(impl_->L, -2, name);
    lua_pop(impl_->L, 1);
}

void ScriptState::SetStringList(ScriptEnv env, const char *name, const std::vector<std::string> &values) {
    lua_State *L = impl_->L;
    PushEnv(env);
    lua_createtable(L, static_cast<int>(values.size()), 1);
    for (size_t i = 0; i < values.size(); ++i) {
        lua_pushlstring(L, values[i].data(), values[i].size());
        lua_rawseti(L, -2, static_cast<int>(i));
    }
    lua_setfield(L, -2, name);
    lua_pop(L, 1);
}

void ScriptState::SetPointer(ScriptEnv env, const char *name, const char *ctype, void *ptr) {
    lua_State *L = impl_->L;
    PushBindingFunction("setPointer");
    PushEnv(env);
    lua_pushstring(L, name);
    lua_pushstring(L, ctype);
    if (ptr)
        lua_pushlightuserdata(L, ptr);
    else
        lua_pushnil(L);
    // Only a bad C type fails here, a fault of the host's code.
    if (lua_pcall(L, 4, 0, 0) != 0) {
        const std::string error = lua_tostring(L, -1);
        lua_pop(L, 1);
        throw std::invalid_argument("SetPointer: " + error);
    }
}

double ScriptState::GetNumber(ScriptEnv env, const char *name, double fallback) const {
    lua_State *L = impl_->L;
    PushEnv(env);
    lua_getfield(L, -1, name);
    const double value = lua_type(L, -1) == LUA_TNUMBER ? lua_tonumber(L, -1) : fallback;
    lua_pop(L, 2);
    return value;
}

} // namespace Orvane
