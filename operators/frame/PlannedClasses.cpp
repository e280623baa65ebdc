// Registers the classes this library names but does not build yet. Each
// keeps its full identity (so lists, searches and documents know it), and a
// tool among them constructs and keeps its saved values, but every request it
// gets fails with one console line saying that it is not available yet.
#include <deque>
#include <string>
#include <string_view>

#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "operators/frame/ClassTable.h"
#include "operators/frame/Registration.h"

namespace Orvane {
namespace {

/// A tool whose processing is not built yet.
class PlannedTool : public ThreadedOperator {
public:
    PlannedTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        const uint32_t kind = reg ? reg->TypeFlags() : 0;
        const OvID type = (kind & RegKindMask) ? CLSID_DataType_Mask : CLSID_DataType_Image;
        if (!(kind & RegKindModifier))
            output_ = AddOutputTagList("Output", "Output", {{LinkDataType, type}, {LinkMain, 1}});
        else
            output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Number}});
    }

    bool IsPlaceholder() const override { return true; }

    void Process(Request *req) override {
        Fail(req, "%s: the %s tool is not available yet in this version of Orvane\n", Name().c_str(),
             GetRegistry() ? GetRegistry()->DisplayName() : "requested");
        req->SetOutputData(output_, nullptr);
    }

private:
    Output *output_;
};

/// A data type, format, transition or control class that is not built yet.
class PlannedObject : public RefObject {
public:
    PlannedObject(const Registry *, const ScriptVal &, const TagList &) {}
};

const OvID *HostBase(std::string_view id) {
    static const std::pair<std::string_view, const OvID *> bases[] = {
        {"Object", &CLSID_Object},
        {"Operator", &CLSID_Operator},
        {"ThreadedOperator", &CLSID_ThreadedOperator},
        {"SourceOperator", &CLSID_SourceOperator},
        {"MaskOperator", &CLSID_MaskOperator},
        {"ShapeOperator", &CLSID_ShapeOperator},
        {"Parameter", &CLSID_Parameter},
        {"ImageFormat", &CLSID_ImageFormat},
        {"SubInputs", &CLSID_SubInputs},
        {"PreviewControl", &CLSID_PreviewControlBase},
        {"ZQImageTransition", &CLSID_ZQImageTransition},
    };
    for (const auto &[name, base] : bases)
        if (name == id) return base;
    return nullptr;
}

void AddSplit(TagList &tags, Tag tag, const char *list) {
    if (!list) return;
    std::string_view rest(list);
    while (!rest.empty()) {
        const size_t bar = rest.find('|');
        const std::string_view word = rest.substr(0, bar);
        if (!word.empty()) {
            if (KindOfTag(tag) == TagKind::ID)
                tags.Add({tag, OvID(word)});
            else
                tags.Add(TagItem::Raw(tag, reinterpret_cast<uint64_t>(word.data()))); // points into the literal
        }
        if (bar == std::string_view::npos) break;
        rest.remove_prefix(bar + 1);
    }
}

struct PlannedRegistrations {
    std::deque<OvID> ids; // class IDs and library bases; deque keeps their addresses
    std::deque<RegistrationBase> rows;

    PlannedRegistrations() {
        for (const ClassDesc &d : PlannedClasses()) {
            const OvID &id = ids.emplace_back(d.id);
            const OvID *base = nullptr;
            if (d.base) {
                base = HostBase(d.base);
                if (!base) base = &ids.emplace_back(d.base);
            }
            TagList tags = d.attrs;
            tags.Set({RegTypeFlags, static_cast<long long>(d.kind)});
            if (d.creatable) tags.Set({RegPlanned, 1});
            if (d.classWord) tags.Set({RegClassName, d.classWord});
            for (auto [tag, text] : {std::pair{RegPath, d.path},
                                     {RegName, d.name},
                                     {RegCategory, d.category},
                                     {RegAbbreviation, d.abbreviation},
                                     {RegHelp, d.help},
                                     {RegIcon, d.icon}})
                if (text) tags.Set({tag, text});
            AddSplit(tags, RegAlias, d.aliases);
            AddSplit(tags, RegOldClassId, d.oldIds);
            const bool isOperator = (d.kind & RegKindOperator) != 0;
            ClassFactory factory = nullptr;
            if (d.creatable) factory = isOperator ? &ConstructClass<PlannedTool> : &ConstructClass<PlannedObject>;
            // A row without a class word is a bare marker: no hooks, no script record.
            const bool bare = !d.classWord && !d.creatable;
            RegInitFunction init = bare ? nullptr : isOperator ? &Operator::RegInit : &Object::RegInit;
            RegCleanupFunction cleanup = bare ? nullptr : isOperator ? &Operator::RegCleanup : &Object::RegCleanup;
            rows.emplace_back(id, base, factory, init, cleanup,
                              bare ? nullptr : std::make_unique<ScriptInfo>(1, id.Text(), "", ""),
                              isOperator ? typeid(PlannedTool) : typeid(PlannedObject),
                              isOperator ? typeid(ThreadedOperator) : typeid(RefObject), std::move(tags));
        }
    }
};

const PlannedRegistrations s_Planned;

} // namespace
} // namespace Orvane
