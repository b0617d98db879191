#include "app/exit_status.h"

namespace ox {

int processExitCode(int32_t status) {
    if (status == kStatusSuccess) return 0;
    if (status == kStatusAborted) return 199;
    if (status == kStatusCrash) return 139;
    const uint32_t bits = static_cast<uint32_t>(status);
    if ((bits & 0xFFFFFF00u) == 0x20000000u) {
        switch (bits & 0xFFu) {
            case 2:
            case 3:
            case 4:
            case 5:
            case 7:
            case 8:
            case 9:
            case 10:
            case 12:
            case 13:
                return static_cast<int>(bits & 0xFFu);
            default:
                return 1;  // 0x20000000 and codes without a meaning of their own
        }
    }
    // A platform error code that fits the 8 bits of an exit status stands for itself.
    if (status > 0 && status < 256) return status;
    return 1;
}

}  // namespace ox
