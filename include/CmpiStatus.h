#ifndef TAV_IPMI_CMPISTATUS_H
#define TAV_IPMI_CMPISTATUS_H

#include "TavIpmiExport.h"

/// @file
/// The library's exception type, and the CMPI status types it carries.

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
/// CMPI return codes; the library uses 1, 2, 100 and 200 (see @ref
/// contract-exceptions "exceptions").
typedef enum _CMPIrc {
    CMPI_RC_OK = 0,                     ///< success
    CMPI_RC_ERR_FAILED = 1,             ///< a failed IPMI operation or an unavailable value
    CMPI_RC_ERR_ACCESS_DENIED = 2,      ///< not root
    CMPI_RC_ERR_INVALID_NAMESPACE = 3,  ///< CMPI's; not used by the library
    CMPI_RC_ERR_INVALID_PARAMETER = 4,  ///< CMPI's; not used by the library
    CMPI_RC_ERR_INVALID_CLASS = 5,      ///< CMPI's; not used by the library
    CMPI_RC_ERR_NOT_FOUND = 6,          ///< CMPI's; not used by the library
    CMPI_RC_ERR_NOT_SUPPORTED = 7,      ///< CMPI's; not used by the library
    CMPI_RC_DO_NOT_UNLOAD = 50,         ///< CMPI's; not used by the library
    CMPI_RC_NEVER_UNLOAD = 51,          ///< CMPI's; not used by the library
    CMPI_RC_ERROR_SYSTEM = 100,         ///< an operating-system call failed
    CMPI_RC_ERROR = 200                 ///< misuse of the life cycle
} CMPIrc;

struct _CMPIString;
/// The function table of a CMPI string, as the broker fills it.
typedef struct _CMPIStringFT {
    int ftVersion;                                                  ///< table version
    CMPIrc (*release)(struct _CMPIString*);                         ///< frees the string
    struct _CMPIString* (*clone)(const struct _CMPIString*, void*);  ///< copies it
    char* (*getCharPtr)(const struct _CMPIString*, void*);          ///< its characters
} CMPIStringFT;

/// A CMPI string.
typedef struct _CMPIString {
    void* hdl;   ///< character data, as the broker's strings keep it
    CMPIStringFT* ft;  ///< its function table
} CMPIString;

/// A CMPI status: return code and message.
typedef struct _CMPIStatus {
    CMPIrc rc;        ///< return code
    CMPIString* msg;  ///< message, or null
} CMPIStatus;
}
#endif

/// Home of the exception type.
namespace kelInt {

/// The library's one exception type, thrown by value, caught by reference;
/// see @ref contract-exceptions "exceptions" for its codes.
class TAV_IPMI_API CmpiStatus {
public:
    /// rc 0, no message.
    CmpiStatus();
    /// `rc`, no message.
    CmpiStatus(CMPIrc rc);  // NOLINT(google-explicit-constructor): thrown as CmpiStatus(rc)
    ///@{
    /// `rc`; the text is logged once here at error priority, where the error
    /// arises, and not kept.
    CmpiStatus(CMPIrc rc, const char* text);
    CmpiStatus(int rc, const char* text) : CmpiStatus(static_cast<CMPIrc>(rc), text) {}
    ///@}
    /// Code and message pointer of `s`.
    CmpiStatus(_CMPIStatus s);  // NOLINT(google-explicit-constructor)
    virtual ~CmpiStatus();

    CMPIrc rc() const { return status_.rc; }  ///< the return code
    /// The message's characters, or "(null)" without one (the library's own
    /// errors carry none).
    const char* msg() const;
    _CMPIStatus status() const { return status_; }  ///< code and message pointer

private:
    _CMPIStatus status_;
};

}  // namespace kelInt

#endif
