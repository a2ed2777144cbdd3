// The loop over files. Read each_file.h first.
#include "commands/each_file.h"

#include "failure.h"

int for_each_file(const std::vector<std::string> &names,
                  const std::function<bool(const std::string &name)> &work)
{
    int status = 0;
    for (const std::string &name : names) {
        try {
            if (!work(name)) status = 1;
        } catch (const failure &failed) {
            print_failure(failed.what());
            status = 1;
        }
    }
    return status;
}
