#ifndef TAV_IPMI_EXPORT_H
#define TAV_IPMI_EXPORT_H

/// @file
/// Symbol visibility of the shared library.

/// Marks what libtav-ipmi.so exports; everything else stays hidden.
#if defined(__GNUC__)
#define TAV_IPMI_API __attribute__((visibility("default")))
#else
#define TAV_IPMI_API
#endif

#endif
