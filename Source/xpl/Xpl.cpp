#include "xpl/Xpl.h"

#include "xpl/Xtimer.h"

xerr_t xplLibInit(const XlogLogger* logger, const std::string& logFile) {
    // Result codes first: the logger's file operations translate through them.
    xerr_t err = xerrLibInit();
    if (err == XERR_SUCCESS) err = xlogLibInit(logger, logFile, "*:I");
    if (err == XERR_SUCCESS) err = xtimerLibInit();
    return err;
}
