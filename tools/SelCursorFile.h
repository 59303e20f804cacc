#ifndef TAV_IPMI_TOOLS_SELCURSORFILE_H
#define TAV_IPMI_TOOLS_SELCURSORFILE_H

#include <string>

#include "IpmiSelData.h"

namespace CLI {
class App;
}

namespace Tool {

// Where a long-running view's SEL delivery stands, kept in a file so that a
// restart hands over exactly the records logged while it was down. The file
// is written whole to a temporary name and renamed, so a crash or a second
// process never leaves half of one.
class SelCursorFile {
public:
    // Adds `--state FILE` to a view; by default `name` under /var/lib/tav-ipmi,
    // and none on a simulated controller, whose log is not the host's.
    void addOption(CLI::App& sub, const std::string& name);
    // Before the loop starts: resumes delivery after the cursor kept, if any.
    // A missing or damaged file starts afresh with one warning on stderr.
    void resume();
    // After a record was handed on.
    void save(const Ipmi::IpmiSelData& record);

private:
    std::string path_;
    bool failedOnce_ = false;
};

}  // namespace Tool

#endif
