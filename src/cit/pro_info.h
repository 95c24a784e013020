// Single bytes of the product-information record in NVRAM, read and written by index.
#ifndef TOLKD_CIT_PRO_INFO_H
#define TOLKD_CIT_PRO_INFO_H

#define PRODUCT_INFO_FILE_NO 61
#define PRODUCT_INFO_SIZE 1024
// A flag is one byte of the record.
#define FLAG_VALUE_MAX 255

#define FLAG_MMI1_RESULT 202
#define FLAG_RESET_STATE 208
#define FLAG_USER_AT 209

// The byte at index (0..255), or -1 when it could not be read.
int getFlag(int index);
// Returns 0 once the new value is stored, -1 when it did not reach the store.
int setFlag(int index, unsigned char value);

#endif
