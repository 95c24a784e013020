/* The two limits of bionic's property header that libcutils' properties.h needs;
 * the rest of bionic is not on a Debian host. */
#ifndef TOLK_BIONIC_SHIM_SYSTEM_PROPERTIES_H
#define TOLK_BIONIC_SHIM_SYSTEM_PROPERTIES_H
#define PROP_NAME_MAX 32
#define PROP_VALUE_MAX 92
#endif
