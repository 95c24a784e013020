// Host stand-in for the vendor NVRAM library: record files addressed by number.
#ifndef TOLK_PLATFORM_LIBNVRAM_H
#define TOLK_PLATFORM_LIBNVRAM_H

#include <stdbool.h>

#ifdef __cplusplus
extern "C" {
#endif

// Handle of one open NVRAM file; iFileDesc is negative when the open failed.
typedef struct {
    int iFileDesc;
    int ifile_lid;
    bool bIsRead;
} F_ID;

// Opens NVRAM file file_lid positioned at its record; fills record size and count.
F_ID NVM_GetFileDesc(int file_lid, int *pRecSize, int *pRecNum, bool IsRead);
// Ends an access; what was written before is seen by the next open.
bool NVM_CloseFileDesc(F_ID FileID);

#ifdef __cplusplus
}
#endif

#endif
