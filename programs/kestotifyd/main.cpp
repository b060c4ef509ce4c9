#include "programs/daemon/program.h"
#include "programs/kestotifyd/monitor.h"
#include "programs/kestotifyd/options.h"

int main(int argc, char** argv) {
    int status = 0;
    const auto options = kestotifyd::ParseOptions(argc, argv, status);
    if (!options) {
        return status;
    }
    return quivra::daemon::RunProgram("kestotifyd", options->common, [&] {
        kestotifyd::Monitor(*options).Run();
        return 0;
    });
}
