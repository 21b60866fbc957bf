#include "operations/check.h"

namespace vaultora {

// Placeholder until the check and recovery are built: nothing is checked, nothing recovered.
Result CheckArchive(Vaultora&) { return kOk; }
Result OfferRecovery(Vaultora&, Result loadResult) { return loadResult; }

}  // namespace vaultora
