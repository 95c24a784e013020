#include <tolk_platform/device_root.h>
