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
    DownloadQueueHandle *queue;
    DownloadTaskInfo *info;
    char buf[64];
    char condition[32];
    int id;
    DBConn_tag *conn = DownloadDBConnect();
    CHECK(conn != NULL);
    DownloadDBClose(conn);
    CHECK(DownloadDBExec("DELETE FROM download_queue WHERE username='c_api'") >= 0);

    /* Configuration: new tasks copy its seeding defaults. */
    memset(&conf, 0, sizeof conf);
    CHECK(DownloadConfGet(NULL) == -1);
    strcpy(conf.download_when, "00:00-23:59");
    conf.seeding_ratio = 150;
    CHECK(DownloadConfSet(&conf) == 0);

    /* Tasks. */
    CHECK(DownloadTaskAddWithDst("c_api", "http://example.invalid/c.iso", "/volume1/c") == 0);
    id = DownloadLastTaskIDGet("c_api");
    CHECK(id > 0);
    CHECK(DownloadTaskStatusGet(id) == TASK_STATUS_WAITING);
    CHECK(DownloadTaskCount("C_API") == 1);

    /* Queue listing. */
    snprintf(condition, sizeof condition, "task_id=%d", id);
    queue = DownloadQueueOpen(condition);
    CHECK(queue != NULL);
    info = queue != NULL ? DownloadQueueGet(queue) : NULL;
    CHECK(info != NULL && strcmp(info->filename, "c.iso") == 0 && info->seeding_ratio == 150);
    CHECK(queue == NULL || DownloadQueueGet(queue) == NULL);
    DownloadQueueClose(queue);
    CHECK(DownloadTaskDelete(id) == 0);
    CHECK(DownloadTaskStatusGet(id) == -1);

    /* Users and utilities. */
    CHECK(DownloadUserShareGet("c_api_nobody", buf, (int)sizeof buf) == 0);
    CHECK(DownloadUtilsIsMagnetLink("MAGNET:?xt=urn:btih:00") == 1);
    CHECK(DownloadUtilsIsFTPEncrptionLink("sftp://host/f") == 2);
    NLIBCErrSet(0x4000);
    CHECK(NLIBCErrGet() == 0x4000);

    if (failures == 0)
        puts("C API calls passed");
    return failures == 0 ? 0 : 1;
}
