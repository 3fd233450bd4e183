// A program outside the build tree, built only against the installed
// package: it calls into all three libraries, then checks one round trip
// through a real database file, per call and through a session.
#include <cstdio>
#include <string>

#include <DACreateRequest.h>
#include <DACursor.h>
#include <DADatabase.h>
#include <DALogger.h>
#include <DAMutex.h>
#include <DASelectRequest.h>
#include <DASession.h>
#include <DAUpsertRequest.h>
#include <dlog.h>

int main(int argc, char** argv)
{
    if (argc != 2) {
        std::fprintf(stderr, "usage: consumer DIRECTORY\n");
        return 2;
    }
    const char* dir = argv[1];
    __dlog_print(LOG_ID_MAIN, DLOG_INFO, DALogger::GetInstance()->GetLogTag(), "consumer %s", "started");
    DAMutex mutex("consumer");
    mutex.Lock();
    mutex.Unlock();

    const auto at = [dir](auto& request) -> auto&
    {
        request.SetPath(dir, "consumer.db");
        request.SetTable("items");
        return request;
    };
    DACreateRequest create;
    at(create).SetColumnKey("label", "TEXT");
    DAUpsertRequest upsert;
    at(upsert).SetData("label", "installed");
    DASelectRequest select;

    DADatabase db;
    DACursor cursor;
    std::string label;
    if (db.CreateTable(create) != 0 || db.Upsert(upsert) != 0 || db.Select(at(select), cursor) != 0 ||
        cursor.MoveToNext() != 0 || cursor.GetString("label", label) != 0 || label != "installed") {
        std::fprintf(stderr, "consumer: round trip failed\n");
        return 1;
    }
    DASession session;  // the same row through a held connection
    if (session.Open(create) != 0 || session.Select(select, cursor) != 0 || cursor.GetCount() != 1) {
        std::fprintf(stderr, "consumer: session read failed\n");
        return 1;
    }
    std::printf("consumer: ok\n");
    return 0;
}
