#include "core/message.h"

int main(int argc, char **argv) {
    ox::message(ox::kMsgInfo, 6, "Zarnex Vorn (Rev: %d)", 179347);
    return 0;
}
