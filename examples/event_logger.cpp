// An event logger on the direct SEL synchroniser: no polling loop, no
// interface start; each pass hands over the records added since the last
// one (all of them on the first pass, or after the log was cleared).
//
//   event_logger [PASSES [SECONDS]]
//
// PASSES passes (0, the default: until killed), SECONDS apart (default 60).
// The library needs root and /dev/ipmi0.

#include <stdio.h>
#include <stdlib.h>
#include <time.h>
#include <unistd.h>

#include <IpmiSel.h>
#include <IpmiSelData.h>

int main(int argc, char** argv) {
    const long passes = argc > 1 ? atol(argv[1]) : 0;
    const unsigned seconds = argc > 2 ? static_cast<unsigned>(atoi(argv[2])) : 60;

    // Kept between calls; all zero asks for the whole log first.
    Ipmi::sel_state state = {};
    for (long pass = 0; passes == 0 || pass < passes; ++pass) {
        if (pass > 0) sleep(seconds);
        Ipmi::Event_log* records = nullptr;
        int count = 0;
        // Calls must not overlap: the synchroniser keeps process-wide state.
        if (!Ipmi::sync_device_eventlog(&records, &count, &state)) {
            fprintf(stderr, "event_logger: the SEL cannot be read; trying again next pass\n");
            continue;
        }
        for (int i = 0; i < count; ++i) {
            const Ipmi::IpmiSelData record(&records[i], 0);
            char text[160];
            Ipmi::build_sel_desc(records[i], text, sizeof text);
            const time_t stamp = record.messageTimeStamp();
            char when[32] = "-";
            struct tm utc;
            if (stamp != static_cast<time_t>(0xFFFFFFFF) && gmtime_r(&stamp, &utc))
                strftime(when, sizeof when, "%Y-%m-%dT%H:%M:%SZ", &utc);
            printf("SEL %04x %s %s\n", record.recordId(), when, text);
        }
        free(records);  // the array is the caller's
        fflush(stdout);
    }
    return 0;
}
