#ifndef TAV_IPMI_CMPISTATUS_H
#define TAV_IPMI_CMPISTATUS_H

#include "TavIpmiExport.h"

// The CMPI status types come from the CMPI standard's header when the build
// has it; otherwise a compatible subset with the standard's numeric values.
#if defined(__has_include)
#if __has_include(<cmpidt.h>)
#include <cmpidt.h>
#define TAV_IPMI_HAVE_CMPIDT 1
#endif
#endif

#ifndef TAV_IPMI_HAVE_CMPIDT
extern "C" {
typedef enum _CMPIrc {
    CMPI_RC_OK = 0,
    CMPI_RC_ERR_FAILED = 1,
    CMPI_RC_ERR_ACCESS_DENIED = 2,
    CMPI_RC_ERR_INVALID_NAMESPACE = 3,
    CMPI_RC_ERR_INVALID_PARAMETER = 4,
    CMPI_RC_ERR_INVALID_CLASS = 5,
    CMPI_RC_ERR_NOT_FOUND = 6,
    CMPI_RC_ERR_NOT_SUPPORTED = 7,
    CMPI_RC_DO_NOT_UNLOAD = 50,
    CMPI_RC_NEVER_UNLOAD = 51,
    CMPI_RC_ERROR_SYSTEM = 100,
    CMPI_RC_ERROR = 200
} CMPIrc;

struct _CMPIString;
typedef struct _CMPIStringFT {
    int ftVersion;
    CMPIrc (*release)(struct _CMPIString*);
    struct _CMPIString* (*clone)(const struct _CMPIString*, void*);
    char* (*getCharPtr)(const struct _CMPIString*, void*);
} CMPIStringFT;

typedef struct _CMPIString {
    void* hdl;   // character data, as the broker's strings keep it
    CMPIStringFT* ft;
} CMPIString;

typedef struct _CMPIStatus {
    CMPIrc rc;
    CMPIString* msg;
} CMPIStatus;
}
#endif

namespace kelInt {

// The library's one exception type, thrown by value, caught by reference.
class TAV_IPMI_API CmpiStatus {
public:
    CmpiStatus();
    CmpiStatus(CMPIrc rc);  // NOLINT(google-explicit-constructor): thrown as CmpiStatus(rc)
    // The text is logged once here, where the error arises, and not kept.
    CmpiStatus(CMPIrc rc, const char* text);
    CmpiStatus(int rc, const char* text) : CmpiStatus(static_cast<CMPIrc>(rc), text) {}
    CmpiStatus(_CMPIStatus s);  // NOLINT(google-explicit-constructor)
    virtual ~CmpiStatus();

    CMPIrc rc() const { return status_.rc; }
    const char* msg() const;
    _CMPIStatus status() const { return status_; }

private:
    _CMPIStatus status_;
};

}  // namespace kelInt

#endif
