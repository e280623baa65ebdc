#pragma once
// Application: the process-wide host state: application attributes (the
// switches tools select code paths by) and the tool modules loaded into the
// class registry.
//
// Loading a module runs its static initialisers, which enter its classes into
// ClassRegistry; the host then runs each new row's RegInitFunc.
//
// Thread safety: attributes are set at start-up and read by renders; modules
// load on the main thread.
#include <string>
#include <vector>

#include "host/core/Object.h"

namespace Orvane {

class ORVANE_API Application : public RefObject {
public:
    /// Loads a module by path. On failure returns false and says why.
    bool LoadModule(const std::string &path, std::string &error);
    /// Loads the standard tool library: $ORVANE_OPERATORS if set, else
    /// liborvaneoperators.so beside the host library.
    bool LoadOperators(std::string &error);
    bool OperatorsLoaded() const { return operatorsLoaded_; }
    const std::vector<std::string> &Modules() const { return modules_; }

    /// Hash of the attributes that change results (part of cache keys).
    uint64_t AttrHash() const;

private:
    friend ORVANE_API Application *GetApp();
    Application();
    std::vector<std::string> modules_;
    std::vector<void *> handles_;
    bool operatorsLoaded_ = false;
};

/// The application object, made on first use.
ORVANE_API Application *GetApp();

} // namespace Orvane
