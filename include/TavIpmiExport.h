#ifndef TAV_IPMI_EXPORT_H
#define TAV_IPMI_EXPORT_H

// Everything not marked with this stays hidden in libtav-ipmi.so.
#if defined(__GNUC__)
#define TAV_IPMI_API __attribute__((visibility("default")))
#else
#define TAV_IPMI_API
#endif

#endif
