#include "host/script/ScriptClasses.h"

#include <mutex>

extern "C" {
#include <lauxlib.h>
#include <lua.h>
}

#include "host/script/ScriptState.h"

namespace Orvane {

ScriptObject::~ScriptObject() = default;

namespace {

std::mutex g_lock;
std::vector<ScriptClass> &Classes() {
    static std::vector<ScriptClass> classes;
    return classes;
}

// Binds one class in the trusted globals: its declarations, its functions (cast from the
// addresses handed over, or found by name), the snippets compiled as methods, the Lua C
// functions and constants, and a metatype whose index serves getters, then methods.
const char *const kInstaller = R"lua(
local name, declarations, functions, snippets, cfunctions, constants = ...
local ffi = require("ffi")
-- A type's metatype is set once per state: a second installation keeps the first.
local installed = package.loaded["orvane.scriptclasses"] or {}
package.loaded["orvane.scriptclasses"] = installed
if installed[name] then return end
installed[name] = true
if declarations ~= "" then ffi.cdef(declarations) end
local class, methods, getters = {}, {}, {}
for key, value in pairs(constants) do class[key] = value; methods[key] = value end
for _, f in ipairs(functions) do
    local fn
    if f.address then
        local pointerType, found = f.declaration:gsub(f.symbol .. "%s*%(", "(*)(", 1)
        if found ~= 1 then error(name .. ": " .. f.symbol .. " is not named in its declaration") end
        fn = ffi.cast(pointerType, f.address)
    else
        ffi.cdef(f.declaration .. ";")
        fn = ffi.C[f.symbol]
    end
    local call = fn
    if f.text then
        call = function(...) local r = fn(...) if r == nil then return nil end return ffi.string(r) end
    elseif f.release then
        local release = ffi.cast("void (*)(void *)", f.release)
        call = function(...) local r = fn(...) if r == nil then return nil end return ffi.gc(r, release) end
    end
    if f.kind == "getter" then getters[f.name] = call
    elseif f.kind == "static" then class[f.name] = call
    else methods[f.name] = call end
end
for key, fn in pairs(cfunctions) do methods[key] = fn end
for _, s in ipairs(snippets) do
    local method, params = s[1]:match("^%s*([%w_]+)%s*%((.*)%)%s*$")
    if not method then error(name .. ": bad snippet signature " .. s[1]) end
    local chunk, err = loadstring("return function(" .. params .. ")\n" .. s[2] .. "\nend", "=" .. name .. "." .. method)
    if not chunk then error(err) end
    methods[method] = chunk()
end
ffi.metatype(name, { __index = function(self, key)
    local getter = getters[key]
    if getter then return getter(self) end
    return methods[key]
end })
_G[name] = class
)lua";

void PushClassArguments(lua_State *L, const ScriptClass &c) {
    lua_pushstring(L, c.name.c_str());
    lua_pushstring(L, c.declarations.c_str());
    lua_createtable(L, static_cast<int>(c.functions.size()), 0);
    int i = 0;
    for (const ScriptClassFunction &f : c.functions) {
        lua_createtable(L, 0, 7);
        lua_pushstring(L, f.scriptName.c_str());
        lua_setfield(L, -2, "name");
        lua_pushstring(L, f.declaration.c_str());
        lua_setfield(L, -2, "declaration");
        lua_pushstring(L, f.symbol.c_str());
        lua_setfield(L, -2, "symbol");
        if (f.address) {
            lua_pushlightuserdata(L, f.address);
            lua_setfield(L, -2, "address");
        }
        lua_pushstring(L, f.kind == ScriptClassFunction::Getter   ? "getter"
                          : f.kind == ScriptClassFunction::Static ? "static"
                                                                  : "method");
        lua_setfield(L, -2, "kind");
        lua_pushboolean(L, f.returnsText);
        lua_setfield(L, -2, "text");
        if (f.releaseResult) {
            lua_pushlightuserdata(L, reinterpret_cast<void *>(f.releaseResult));
            lua_setfield(L, -2, "release");
        }
        lua_rawseti(L, -2, ++i);
    }
    lua_createtable(L, static_cast<int>(c.snippets.size()), 0);
    i = 0;
    for (const auto &[signature, body] : c.snippets) {
        lua_createtable(L, 2, 0);
        lua_pushstring(L, signature.c_str());
        lua_rawseti(L, -2, 1);
        lua_pushlstring(L, body.data(), body.size());
        lua_rawseti(L, -2, 2);
        lua_rawseti(L, -2, ++i);
    }
    lua_createtable(L, 0, static_cast<int>(c.cFunctions.size()));
    for (const auto &[key, fn] : c.cFunctions) {
        lua_pushcfunction(L, fn);
        lua_setfield(L, -2, key.c_str());
    }
    lua_createtable(L, 0, static_cast<int>(c.numbers.size() + c.texts.size()));
    for (const auto &[key, value] : c.numbers) {
        lua_pushnumber(L, value);
        lua_setfield(L, -2, key.c_str());
    }
    for (const auto &[key, value] : c.texts) {
        lua_pushstring(L, value.c_str());
        lua_setfield(L, -2, key.c_str());
    }
}

} // namespace

void RegisterScriptClass(ScriptClass cls) {
    std::lock_guard<std::mutex> guard(g_lock);
    for (ScriptClass &c : Classes())
        if (c.name == cls.name) {
            c = std::move(cls);
            return;
        }
    Classes().push_back(std::move(cls));
}

std::vector<std::string> ScriptClassNames() {
    std::lock_guard<std::mutex> guard(g_lock);
    std::vector<std::string> names;
    for (const ScriptClass &c : Classes()) names.push_back(c.name);
    return names;
}

std::string InstallScriptClasses(ScriptState &state) {
    std::vector<ScriptClass> classes;
    {
        std::lock_guard<std::mutex> guard(g_lock);
        classes = Classes();
    }
    lua_State *L = state.Lua();
    for (const ScriptClass &c : classes) {
        if (luaL_loadbuffer(L, kInstaller, std::char_traits<char>::length(kInstaller), "=script classes") != 0) {
            std::string error = lua_tostring(L, -1);
            lua_pop(L, 1);
            return error;
        }
        PushClassArguments(L, c);
        if (std::string error = state.CallOnStack(ScriptEnv::Trusted, 6); !error.empty()) return c.name + ": " + error;
    }
    return {};
}

void *ScriptObjectArgument(lua_State *L, int index) {
    constexpr int kCData = 10; // LuaJIT's type number of cdata values
    if (lua_type(L, index) == LUA_TLIGHTUSERDATA) return lua_touserdata(L, index);
    if (lua_type(L, index) != kCData) return nullptr;
    // A cdata pointer's payload is the pointer itself.
    const void *payload = lua_topointer(L, index);
    return payload ? *static_cast<void *const *>(payload) : nullptr;
}

} // namespace Orvane
