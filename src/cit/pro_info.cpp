// Single bytes of the product-information record, read and written by index.
//
// Every call opens the NVRAM file, checks that it is exactly one record of
// PRODUCT_INFO_SIZE bytes, and closes it again: the daemon keeps no copy of the
// record, so what another writer stored is always seen.
#include "cit/pro_info.h"

#include <errno.h>
#include <string.h>
#include <unistd.h>

#include <libnvram.h>

#include "core/tolkd_log.h"

namespace {

bool validIndex(int index) { return index >= 0 && index < PRODUCT_INFO_SIZE; }

// Reads the whole record from an open handle. A short read counts as a failure:
// a partly filled record must never be handed out or written back.
bool readRecord(const F_ID &fid, unsigned char *record) {
    memset(record, 0, PRODUCT_INFO_SIZE);
    ssize_t got = read(fid.iFileDesc, record, PRODUCT_INFO_SIZE);
    return got == PRODUCT_INFO_SIZE;
}

}  // namespace

// A flag that cannot be read has no value: -1, never a fallback byte that the
// station would take for a stored one.
int getFlag(int index) {
    if (!validIndex(index)) {
        NLOGE("Invalid flag index %d", index);
        return -1;
    }

    int recSize = 0;
    int recNum = 0;
    F_ID fid = NVM_GetFileDesc(PRODUCT_INFO_FILE_NO, &recSize, &recNum, false);
    if (fid.iFileDesc < 0) {
        NLOGE("NVM_GetFileDesc is fails errno %d\n", errno);
        return -1;
    }
    if (recNum != 1) {
        NLOGE("Unexpected record num %d", recNum);
        NVM_CloseFileDesc(fid);
        return -1;
    }
    if (recSize != PRODUCT_INFO_SIZE) {
        NLOGE("Unexpected record size %d PRODUCT_INFO %d", recSize, PRODUCT_INFO_SIZE);
        NVM_CloseFileDesc(fid);
        return -1;
    }

    unsigned char record[PRODUCT_INFO_SIZE];
    if (!readRecord(fid, record)) {
        NLOGE("Read NVRAM fails errno %d\n", errno);
        NVM_CloseFileDesc(fid);
        return -1;
    }
    NVM_CloseFileDesc(fid);
    return record[index];
}

// Both opens of setFlag: a record of any other shape is neither read nor written.
static bool openRecordForSet(F_ID *fid) {
    int recSize = 0;
    int recNum = 0;
    *fid = NVM_GetFileDesc(PRODUCT_INFO_FILE_NO, &recSize, &recNum, false);
    if (fid->iFileDesc < 0) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "NVM_GetFileDesc is fails errno %d\n", errno);
        return false;
    }
    if (recNum != 1) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Unexpected record num %d", recNum);
        NVM_CloseFileDesc(*fid);
        return false;
    }
    if (recSize != PRODUCT_INFO_SIZE) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Unexpected record size %d PRODUCT_INFO %d", recSize,
                PRODUCT_INFO_SIZE);
        NVM_CloseFileDesc(*fid);
        return false;
    }
    return true;
}

int setFlag(int index, unsigned char value) {
    if (!validIndex(index)) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Invalid flag index %d", index);
        return -1;
    }

    F_ID fid;
    if (!openRecordForSet(&fid)) return -1;
    unsigned char record[PRODUCT_INFO_SIZE];
    if (!readRecord(fid, record)) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Read NVRAM fails errno %d\n", errno);
        NVM_CloseFileDesc(fid);
        return -1;
    }
    NVM_CloseFileDesc(fid);
    record[index] = value;

    // The record goes back through a second open, whose shape is checked again so
    // that exactly the bytes just read are written. The station records a pass for
    // what it believes stored, so a write or a close that fails is reported.
    if (!openRecordForSet(&fid)) return -1;
    ssize_t put = write(fid.iFileDesc, record, sizeof(record));
    bool stored = put == PRODUCT_INFO_SIZE;
    if (!stored) LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Write NVRAM fails errno %d\n", errno);
    if (!NVM_CloseFileDesc(fid) && stored) {
        LOG_RAW(LOG_LVL_ERROR, NVRAM_LOG_TAG, "Close NVRAM fails errno %d\n", errno);
        stored = false;
    }
    return stored ? 0 : -1;
}
