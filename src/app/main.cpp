// The vaultora program: builds the argument vector, reads the options and runs one verb.
#include <string>
#include <vector>

#include "app/batch_add.h"
#include "app/batch_delete.h"
#include "app/batch_extract.h"
#include "app/cmdline.h"
#include "app/properties.h"
#include "operations/compact.h"

namespace {

using vaultora::CommandTable;
using vaultora::Verb;

// The place where each verb gets its handler. Until a verb is built its row keeps the
// "not available yet" placeholder; unknown verbs always get the usage text.
void registerVerbs(CommandTable& table) {
    // Batch verbs (each runs without a window and returns the exit code):
    table.setHandler(Verb::kAdd, vaultora::runAdd);
    table.setHandler(Verb::kEncrypt, vaultora::runAdd);
    table.setInvalidArgumentReporter(vaultora::reportInvalidArgument);
    table.setHandler(Verb::kExtract, vaultora::runExtract);
    table.setHandler(Verb::kProperties, vaultora::runProperties);
    table.setHandler(Verb::kDelete, vaultora::runDelete);
    // Still to come:
    //   table.setHandler(Verb::kSend, runSend);
    //   table.setHandler(Verb::kShowPkid, runShowPkid);
    //   table.setHandler(Verb::kMakeSelfExtracted, ...); table.setHandler(Verb::kCheckSelfExtracted, ...);
    //   table.setHandler(Verb::kClipboardAuto / kClipboardDecode / kClipboardEncode, ...);
    //   table.setHandler(Verb::kShowKeyManager, ...);
    //
    // GUI verbs (main window; the hand-over to a process that already holds the archive comes
    // first for kBareArchive, kOpen and kNew):
    //   table.setHandler(Verb::kNone, ...);  table.setHandler(Verb::kBareArchive, ...);
    //   table.setHandler(Verb::kOpen, ...);  table.setHandler(Verb::kNew, ...);
}

}  // namespace

int main(int argc, char** argv) {
    // Closing an archive commits through the full compaction (with its check) and a lost table
    // is offered for recovery.
    vaultora::installOperationHooks();
    std::vector<std::string> args(argv, argv + argc);  // element 0 is the program path
    CommandTable table;
    registerVerbs(table);
    return vaultora::runCommandLine(std::move(args), table);
}
