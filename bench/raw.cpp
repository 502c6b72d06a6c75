#include "bench/raw.h"

namespace bench {

PGconn *raw() {
    static PGconn *conn = [] {
        PGconn *c = PQconnectdb("user=admin dbname=download options='-c "
                                "standard_conforming_strings=on -c bytea_output=hex'");
        return c;
    }();
    return conn;
}

void raw_exec(benchmark::State &state, const std::string &sql) {
    PGresult *r = PQexec(raw(), sql.c_str());
    ExecStatusType st = PQresultStatus(r);
    if (st != PGRES_COMMAND_OK && st != PGRES_TUPLES_OK)
        state.SkipWithError(PQresultErrorMessage(r));
    PQclear(r);
}

} // namespace bench
