/* Calls the C families through the umbrella header, compiled as C11. */
#include <stdio.h>
#include <string.h>
#include <torvale/torvale.h>

static int failures = 0;

#define CHECK(cond)                                                                                \
    do {                                                                                           \
        if (!(cond)) {                                                                             \
            fprintf(stderr, "%s:%d: %s\n", __FILE__, __LINE__, #cond);                             \
            ++failures;                                                                            \
        }                                                                                          \
    } while (0)

int main(void) {
    DownloadConf conf;
    DBConn_tag *conn = DownloadDBConnect();
    CHECK(conn != NULL);
    DownloadDBClose(conn);
    CHECK(DownloadDBExec("SELECT 1") == 1);

    memset(&conf, 0, sizeof conf);
    CHECK(DownloadConfGet(NULL) == -1);
    CHECK(DownloadConfSet(NULL) == -1);

    if (failures == 0)
        puts("C API calls passed");
    return failures == 0 ? 0 : 1;
}
