// Lists the appliance's LUNs; given a name, a size in bytes and a volume's path, makes a LUN first.
#include <ISCSIErrorCode.h>
#include <ISCSILIBLUN.h>

#include <cstdlib>
#include <iostream>

using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

namespace {

int report(int code)
{
    std::cerr << "luns: error " << code << " (" << ISCSI::ErrorCodeToString(code) << ")\n";
    return 1;
}

} // namespace

int main(int argc, char **argv)
{
    if (argc != 1 && argc != 4) {
        std::cerr << "usage: luns [NAME BYTES LOCATION]\n";
        return 2;
    }
    if (argc == 4) {
        ISCSILIBLUN lun(argv[1], NORV_LUN_TYPE_ADV, argv[3], std::strtoull(argv[2], nullptr, 10), 4096);
        if (int code = lun.createLUN())
            return report(code);
        std::cout << "made " << lun.info.uuid << "\n";
    }

    std::vector<ISCSI::ISCSILUNInfo> luns;
    if (int code = ISCSILIBLUN::ListLUN(luns, ISCSI::ISCSILUNInfo::LOAD_STATUS))
        return report(code);
    std::cout << luns.size() << " LUNs\n";
    for (const ISCSI::ISCSILUNInfo &lun : luns)
        std::cout << lun.lun_id << " " << lun.name << " " << lun.size << " " << lun.status << "\n";
}
