#pragma once
// SubInputs: a named group of inputs that one object adds to its owner tool,
// such as one layer of a multi-layer tool. While an Adding scope lives, the
// inputs the owner adds get the group's prefix ("PolyMask3.Polyline", or the
// plain ID for an empty group) and are listed as the group's, so that the
// group can be read, reset or taken out together.
//
// Thread safety: built and changed on the main thread; reading the list is
// safe from any thread once the group is complete.
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class Input;
class Operator;

class ORVANE_API SubInputs {
public:
    SubInputs(Operator *owner, std::string group) : owner_(owner), group_(std::move(group)) {}
    virtual ~SubInputs() = default;
    SubInputs(const SubInputs &) = delete;
    SubInputs &operator=(const SubInputs &) = delete;

    Operator *Owner() const { return owner_; }
    const std::string &Group() const { return group_; }
    /// Every input added in an Adding scope, in the order added.
    const std::vector<Input *> &AllInputs() const { return inputs_; }

    /// Makes the group the owner's current one for its lifetime.
    class ORVANE_API Adding {
    public:
        explicit Adding(SubInputs &group);
        ~Adding();
        Adding(const Adding &) = delete;
        Adding &operator=(const Adding &) = delete;

    private:
        SubInputs &group_;
        std::string saved_;
        size_t first_;
    };

private:
    Operator *owner_;
    std::string group_;
    std::vector<Input *> inputs_;
};

} // namespace Orvane
