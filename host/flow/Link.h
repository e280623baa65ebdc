#pragma once
// Input and Output: the two ends of a link on a tool.
//
// An Input carries its whole description as tags (type, control, page,
// limits, defaults, visibility, notify, passive, priority, send-request), so
// the command line can describe a tool today and a panel can be built from it
// later. Its value is one of: a constant, an animation curve, or a link to
// another tool's Output. Hard limits (InputMinAllowed/MaxAllowed) and
// InputInteger apply to every value set; slider limits do not.
//
// Ownership: a tool owns its inputs and outputs for its whole life; the tool
// keeps the raw pointers the Add* calls returned.
//
// Thread safety: values are set on the main thread between renders; renders
// read them.
#include <memory>
#include <string>
#include <vector>

#include "host/core/TagList.h"
#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/Parameter.h"

namespace Orvane {

class Operator;
class Output;

class ORVANE_API Input {
public:
    Input(Operator *owner, std::string name, OvID id, const TagList &tags, int index, int page);

    OvID ID() const { return id_; }
    const std::string &Name() const { return name_; }
    /// The control's label: ControlLabel, or the name.
    const char *Label() const;
    Operator *Owner() const { return owner_; }
    int Index() const { return index_; }
    int Page() const { return page_; }
    const TagList &Tags() const { return tags_; }
    OvID DataType() const { return dataType_; }
    int Priority() const { return static_cast<int>(tags_.GetLong(InputPriority, defaultPriority_)); }
    bool IsRequired() const;
    bool IsPassive() const { return tags_.GetBool(InputPassive); }
    bool IsExternal() const { return tags_.GetLong(InputExternal, 1) != 0; }
    bool SendsRequest() const { return tags_.GetLong(InputSendRequest, 1) != 0; }
    bool Notifies() const { return tags_.GetBool(InputNotify); }
    bool IsVisible() const { return tags_.GetLong(ControlVisible, 1) != 0; }
    bool IsInteger() const { return tags_.GetBool(InputInteger); }
    /// LinkMain number (1 = first connector), 0 for a control-only input.
    int MainIndex() const { return static_cast<int>(tags_.GetLong(LinkMain, 0)); }

    /// Changes tags at run time (visibility, limits, labels).
    void SetAttrsTagList(const TagList &tags);
    /// Replaces the entries of a list control whose entries follow the flow
    /// (a switch's inputs by name).
    void SetChoices(const std::vector<std::string> &labels);

    // ---- value ----
    const Ref<Parameter> &Default() const { return default_; }
    /// Sets a constant (clamped by the hard limits; rounded for integer
    /// inputs). Drops a curve; keeps a link only if `keepLink`. False when the
    /// value has the wrong type for this input.
    bool SetValue(Ref<Parameter> value);
    bool SetCurve(AnimCurve curve);
    /// Links to `output`; false when the types do not fit or (with
    /// `checkLoop`) the link would close a loop. A caller linking many tools
    /// at once may check for loops once at the end instead.
    bool ConnectTo(Output *output, bool checkLoop = true);
    void Disconnect();
    /// Resets to the default constant.
    void ResetValue();

    Output *Link() const { return link_; }
    /// A link a document named to a tool this program does not have; kept
    /// (as "Tool.Output") to be written back unchanged.
    const std::string &UnresolvedLink() const { return unresolvedLink_; }
    void SetUnresolvedLink(std::string path) { unresolvedLink_ = std::move(path); }
    const AnimCurve *Curve() const { return curve_.get(); }
    const Ref<Parameter> &Constant() const { return value_; }
    bool IsAnimated() const { return curve_ != nullptr; }
    /// True when the value is the default constant.
    bool IsDefault() const;
    /// Set for a value a document gave: saved again even when it equals the
    /// default, since tools may work other values out from it (a clip's out
    /// point follows its in point unless the document says otherwise).
    bool WrittenInDocument() const { return writtenInDocument_; }
    void SetWrittenInDocument(bool written) { writtenInDocument_ = written; }
    /// The unlinked value at `time` (constant or curve); null for a link or
    /// an image input without a link.
    Ref<Parameter> ValueAt(double time) const;

    /// Applies the hard limits and integer rounding to a number or point;
    /// other values pass unchanged. Null when the type does not fit.
    Ref<Parameter> Conform(Ref<Parameter> value) const;

    /// Content hash of the unlinked value at `time`, of the whole curve when
    /// animated (cache keys).
    uint64_t ValueHash(double time) const;

    /// Tells the owner about a new value (NotifyChanged) when the input asks
    /// for it (InputNotify). Value setters call it; the host calls it once
    /// after construction for inputs that want their first value too.
    void Changed();

private:
    friend class Operator; // renumbers inputs when some are taken out
    Operator *owner_;
    std::string name_;
    OvID id_;
    TagList tags_;
    int index_, page_;
    OvID dataType_;
    int defaultPriority_;
    Ref<Parameter> default_, value_;
    std::unique_ptr<AnimCurve> curve_;
    Output *link_ = nullptr;
    std::string unresolvedLink_;
    bool writtenInDocument_ = false;
};

class ORVANE_API Output {
public:
    Output(Operator *owner, std::string name, OvID id, const TagList &tags, int index);

    OvID ID() const { return id_; }
    const std::string &Name() const { return name_; }
    Operator *Owner() const { return owner_; }
    int Index() const { return index_; }
    const TagList &Tags() const { return tags_; }
    OvID DataType() const { return dataType_; }
    int MainIndex() const { return static_cast<int>(tags_.GetLong(LinkMain, 0)); }

    /// Inputs linked to this output.
    const std::vector<Input *> &Consumers() const { return consumers_; }

private:
    friend class Input;
    Operator *owner_;
    std::string name_;
    OvID id_;
    TagList tags_;
    int index_;
    OvID dataType_;
    std::vector<Input *> consumers_;
};

/// Makes the default value of an input of `dataType` from its tags: a
/// Number from InputDefault, a Point from InputDefaultX/Y, a Text from
/// InputDefaultText, an ID from InputDefaultId; null for images and masks.
ORVANE_API Ref<Parameter> DefaultValueFor(OvID dataType, const TagList &tags);
/// Reads a document value for an input of `dataType`; null when it does not fit.
ORVANE_API Ref<Parameter> ParameterFromScript(OvID dataType, const ScriptVal &v);

} // namespace Orvane
