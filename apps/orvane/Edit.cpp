// orvane check, new, add, set, connect, remove: checking and editing flow
// documents from the command line, so that scripts never write tables by
// hand. Every edit validates like a document load, changes nothing on disk
// when any part fails, and saves atomically, keeping the document's comments.
#include <cstdio>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Registry.h"
#include "host/core/Suggest.h"
#include "host/core/Tags.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane::Cli {
namespace {

/// Positional arguments and --lenient / --force; any other option is an error.
struct EditArgs {
    std::vector<std::string> positional;
    bool lenient = false, force = false;
};

EditArgs ParseEditArgs(const char *command, const std::vector<std::string> &args, bool takesForce) {
    EditArgs a;
    for (const std::string &arg : args) {
        if (arg == "--lenient")
            a.lenient = true;
        else if (arg == "--force" && takesForce)
            a.force = true;
        else if (arg.size() > 1 && arg[0] == '-' && arg[1] == '-')
            throw CliError(ExitUsage, std::string(command) + ": unknown option " + arg);
        else
            a.positional.push_back(arg);
    }
    return a;
}

void Save(const OrvaneDoc &doc, const std::string &path) {
    std::string error;
    if (!SaveDocumentFile(doc, path, error)) throw CliError(ExitFailed, error);
}

std::vector<std::string> ToolNames(const OrvaneDoc &doc) {
    std::vector<std::string> names;
    for (const Operator *op : doc.Tools()) names.push_back(op->Name());
    return names;
}

Operator &FindTool(const OrvaneDoc &doc, const std::string &name, const char *command) {
    Operator *op = doc.FindTool(name);
    if (!op)
        throw CliError(ExitUsage, std::string(command) + ": the flow has no tool '" + name + "'" +
                                      DidYouMean(name, ToolNames(doc)));
    return *op;
}

/// Loads the flow an edit works on: it must exist and have no errors.
void LoadForEdit(const EditArgs &a, OrvaneDoc &doc, const char *command, size_t least) {
    if (a.positional.size() < least) throw CliError(ExitUsage, std::string("see orvane ") + command + " --help");
    LoadLibrary();
    LoadFlow(a.positional[0], doc, a.lenient);
}

/// Loads FLOW, applies `edit` to each argument after it in order, and saves
/// atomically; nothing is saved when an edit throws.
int EditEach(const char *command, const std::vector<std::string> &args,
             const std::function<void(OrvaneDoc &, const std::string &)> &edit) {
    const EditArgs a = ParseEditArgs(command, args, false);
    OrvaneDoc doc;
    LoadForEdit(a, doc, command, 2);
    for (size_t i = 1; i < a.positional.size(); ++i) edit(doc, a.positional[i]);
    Save(doc, a.positional[0]);
    return ExitOk;
}

} // namespace

int RunCheck(const std::vector<std::string> &args) {
    const EditArgs a = ParseEditArgs("check", args, false);
    if (a.positional.empty()) throw CliError(ExitUsage, "check: expected one or more FLOW documents");
    LoadLibrary();
    int status = ExitOk;
    for (const std::string &path : a.positional) {
        OrvaneDoc doc;
        try {
            LoadFlow(path, doc, a.lenient);
            std::printf("%s: ok (%zu tools)\n", path.c_str(), doc.Tools().size());
        } catch (const CliError &e) {
            std::fprintf(stderr, "ERROR: %s\n", e.what());
            status = ExitUsage;
        }
    }
    return status;
}

int RunNew(const std::vector<std::string> &args) {
    const EditArgs a = ParseEditArgs("new", args, true);
    if (a.positional.size() != 1) throw CliError(ExitUsage, "new: expected one FLOW file name");
    const std::string &path = a.positional[0];
    std::error_code ec;
    if (std::filesystem::exists(path, ec) && !a.force)
        throw CliError(ExitUsage, "new: " + path + " exists (--force replaces it)");
    OrvaneDoc doc;
    Save(doc, path);
    std::printf("wrote %s\n", path.c_str());
    return ExitOk;
}

int RunAdd(const std::vector<std::string> &args) {
    const EditArgs a = ParseEditArgs("add", args, false);
    OrvaneDoc doc;
    LoadForEdit(a, doc, "add", 3);
    const std::string &className = a.positional[1], &name = a.positional[2];
    const Registry *row = ClassRegistry ? ClassRegistry->FindByName(className) : nullptr;
    if (!row || !row->CanCreate() || !(row->TypeFlags() & RegKindOperator)) {
        std::vector<std::string> ids;
        for (const Registry *r : ClassRegistry ? ClassRegistry->Rows() : std::vector<const Registry *>{})
            if (r->CanCreate() && (r->TypeFlags() & RegKindOperator)) ids.push_back(r->ID().Text());
        throw CliError(ExitUsage,
                       "add: unknown class '" + className + "'" + DidYouMean(className, ids) + " (see orvane tools)");
    }
    if (!IsToolName(name))
        throw CliError(ExitUsage, "add: '" + name +
                                      "' is not a tool name (letters, digits and _, not starting "
                                      "with a digit)");
    if (doc.FindTool(name) || doc.KeptTools().Find(name))
        throw CliError(ExitUsage, "add: the flow already has a tool '" + name + "'");
    Operator *op = doc.AddTool(row->ID(), name);
    if (!op) throw CliError(ExitFailed, "add: cannot make a " + std::string(row->ID().Text()));
    for (size_t i = 3; i < a.positional.size(); ++i) ApplySet(doc, name + "." + a.positional[i], "add");
    Save(doc, a.positional[0]);
    std::printf("added %s (%s)\n", name.c_str(), row->ID().Text());
    return ExitOk;
}

int RunSetCommand(const std::vector<std::string> &args) {
    return EditEach("set", args, [](OrvaneDoc &doc, const std::string &arg) { ApplySet(doc, arg, "set"); });
}

int RunConnect(const std::vector<std::string> &args) {
    return EditEach("connect", args, [](OrvaneDoc &doc, const std::string &link) {
        const size_t eq = link.find('=');
        if (eq == std::string::npos)
            throw CliError(ExitUsage, "connect expects TOOL.INPUT=OTHER[.OUTPUT], not '" + link + "'");
        std::string source = link.substr(eq + 1);
        if (source.find('.') == std::string::npos) {
            const Output *main = FindTool(doc, source, "connect").FindMainOutput();
            if (!main) throw CliError(ExitUsage, "connect: " + source + " has no main output; name one");
            source += std::string(".") + main->ID().Text();
        }
        ApplySet(doc, link.substr(0, eq + 1) + source, "connect");
    });
}

int RunRemove(const std::vector<std::string> &args) {
    return EditEach("remove", args, [](OrvaneDoc &doc, const std::string &name) {
        for (const auto &out : FindTool(doc, name, "remove").Outputs())
            for (const Input *in : out->Consumers())
                std::printf("unlinked %s.%s\n", in->Owner()->Name().c_str(), in->ID().Text());
        doc.RemoveTool(name);
    });
}

} // namespace Orvane::Cli
