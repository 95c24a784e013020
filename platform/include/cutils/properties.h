// Host stand-in for Android's libcutils system properties.
#ifndef TOLK_PLATFORM_CUTILS_PROPERTIES_H
#define TOLK_PLATFORM_CUTILS_PROPERTIES_H

#ifdef __cplusplus
extern "C" {
#endif

#define PROP_NAME_MAX 32
#define PROP_VALUE_MAX 92
#define PROPERTY_KEY_MAX PROP_NAME_MAX
#define PROPERTY_VALUE_MAX PROP_VALUE_MAX

// Copies the value of key into value (PROPERTY_VALUE_MAX bytes), or default_value
// when the property is unset; returns the length of what was copied.
int property_get(const char *key, char *value, const char *default_value);
// Sets key to value; 0 on success, negative on failure.
int property_set(const char *key, const char *value);
// Calls propfn once for every property that is set.
int property_list(void (*propfn)(const char *key, const char *value, void *cookie), void *cookie);

#ifdef __cplusplus
}
#endif

#endif
