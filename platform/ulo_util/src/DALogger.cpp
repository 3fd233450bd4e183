#include "DALogger.h"

DALogger* DALogger::GetInstance()
{
    // Constructed on first use and deliberately never destroyed, so that
    // threads still logging during process exit find it alive.
    static DALogger* const instance = new DALogger();
    return instance;
}

const char* DALogger::GetLogTag() const
{
    return "ULO_DB";
}
