#pragma once
// Script classes: C++ objects that trusted scripts make and call through
// LuaJIT's FFI. A library registers a class once, when it loads; a trusted
// state gets every registered class with InstallScriptClasses, as a global
// table of the class's name:
//
//   local f = EXRIO.__new()     -- a "static" function; the object is freed when dropped
//   f:ReadOpen("in.exr", -1)    -- a method: a C function, a Lua snippet or a Lua C function
//   if f.IsOpen then ... end    -- a getter: read like a field
//   EXRIO.HALF, f.HALF          -- constants, on the class table and on every object
//
// What a class brings:
//   - C declarations for ffi.cdef (its opaque type and what its functions use);
//   - C functions with their declarations, each handed over as a pointer or,
//     without one, looked up by name among the process's global symbols;
//   - Lua snippets (parameter list and body) that become methods;
//   - Lua C functions (lua_CFunction) that take the object as argument 1
//     (ScriptObjectArgument reads it) and Lua values after it;
//   - constants (numbers and texts).
//
// Only the trusted environment gets classes: they reach files and memory.
//
// Thread safety: registration and installation may run on any thread; a
// state takes the classes registered at the time it installs them.
#include <string>
#include <utility>
#include <vector>

#include "host/core/Export.h"

struct lua_State;

namespace Orvane {

class ScriptState;

/// Base of the objects a script class hands out, so a cast function can check what any of them is.
class ORVANE_API ScriptObject {
public:
    virtual ~ScriptObject();
};

struct ScriptClassFunction {
    enum Kind { Method, Getter, Static };
    std::string scriptName;  ///< the name scripts use ("ReadOpen", "IsOpen", "__new")
    std::string declaration; ///< its C declaration: "bool EXRIO_Get_IsOpen(EXRIO *self)"
    std::string symbol;      ///< the function's name in the declaration
    void *address = nullptr; ///< null: looked up by `symbol` among the process's global symbols
    Kind kind = Method;
    bool returnsText = false; ///< a `const char *` result reaches the script as a string (nil for null)
    /// Frees a pointer result once the script drops it (null: the result is not owned by the script).
    void (*releaseResult)(void *) = nullptr;
};

using ScriptCFunction = int (*)(lua_State *);

struct ScriptClass {
    std::string name;         ///< the C type's name and the global table's
    std::string declarations; ///< ffi.cdef text: at least "typedef struct NAME NAME;"
    std::vector<ScriptClassFunction> functions;
    /// Lua methods: {"Part(self, a1, a2)", "body text"}.
    std::vector<std::pair<std::string, std::string>> snippets;
    std::vector<std::pair<std::string, ScriptCFunction>> cFunctions;
    std::vector<std::pair<std::string, double>> numbers;
    std::vector<std::pair<std::string, std::string>> texts;
};

/// Adds a class, or replaces the one of the same name.
ORVANE_API void RegisterScriptClass(ScriptClass cls);
/// The names of the registered classes, in registration order.
ORVANE_API std::vector<std::string> ScriptClassNames();
/// Gives `state`'s trusted environment every registered class. Empty on success, else the first
/// class's error (a bad declaration or snippet: a fault of the registering code).
ORVANE_API std::string InstallScriptClasses(ScriptState &state);
/// The object pointer a Lua C function got at stack `index`: a cdata pointer or a light userdata;
/// null for anything else.
ORVANE_API void *ScriptObjectArgument(lua_State *L, int index);

} // namespace Orvane
