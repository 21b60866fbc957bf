#include "platform/interaction.h"

namespace vaultora {

int defaultAnswer(uint32_t style) {
    static const int kTable[7][3] = {
        {1, 1, 1},    // OK
        {1, 2, 0},    // OK/Cancel
        {3, 4, 5},    // Abort/Retry/Ignore
        {6, 7, 2},    // Yes/No/Cancel
        {6, 7, 0},    // Yes/No
        {4, 2, 0},    // Retry/Cancel
        {2, 10, 11},  // Cancel/Try again/Continue
    };
    uint32_t group = style & 7;
    uint32_t index = (style >> 8) & 3;
    if (group == 0) return 1;
    if (group > 6 || index == 3) return 0;
    return kTable[group][index];
}

DefaultInteraction& DefaultInteraction::instance() {
    static DefaultInteraction d;
    return d;
}

}  // namespace vaultora
