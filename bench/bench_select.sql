-- The queue of the selection benchmarks (bench_select.cpp), made in the server.
-- It REPLACES download_queue and user_setting. By hand:
--   psql -U admin -d download -c "SET bench.tasks = 100000" -c "SET bench.pid = $$" \
--        -f bench/bench_select.sql
--
-- bench.tasks tasks over 1,000 users (every hundredth user disabled); 1% of the tasks
-- waiting, a tenth of those on ftp:// links; 200 downloading with the live pid
-- bench.pid, half of them on ftp:// links, two on each of 50 servers; the rest
-- finished, paused or failed.
TRUNCATE download_queue, user_setting RESTART IDENTITY;

INSERT INTO user_setting (username, uid, user_disabled)
SELECT 'user' || lpad(u::text, 4, '0'), 1000 + u, u % 100 = 0
FROM generate_series(1, 1000) AS u;

WITH params AS (
    SELECT current_setting('bench.tasks')::int AS tasks,
           greatest(current_setting('bench.tasks')::int / 200, 1) AS step,
           current_setting('bench.pid')::int AS pid
), rows AS (
    SELECT i, tasks, pid,
           i % 100 = 0 AS waiting,
           i % step = 1 AND i / step < 200 AS downloading,
           i / step AS nth
    FROM params, generate_series(1, (SELECT tasks FROM params)) AS i
)
INSERT INTO download_queue (username, pid, url, filename, created_time, started_time, status,
                            total_size, current_size, current_rate, upload_rate, total_upload,
                            seeding_ratio, seeding_interval, seeding_elapsed, destination)
SELECT 'user' || lpad((1 + (i / 100 + i) % 1000)::text, 4, '0'),
       CASE WHEN downloading THEN pid ELSE -1 END,
       CASE
           WHEN downloading AND nth % 2 = 0 THEN
               'ftp://ftp' || (nth / 2 % 50) || '.example.net/pub/file' || i
           WHEN waiting AND i / 100 % 10 = 0 THEN
               'ftp://FTP' || (i / 1000 % 60) || '.example.net/pub/file' || i
           ELSE 'http://www.example.com/files/file' || i || '.iso'
       END,
       'file' || i || '.iso',
       1700000000 + i, 0,
       CASE
           WHEN downloading THEN 2
           WHEN waiting THEN 1
           WHEN i % 10 = 3 THEN 3
           WHEN i % 10 = 7 THEN 101
           ELSE 5
       END,
       1048576, 0, 0, 0, 0, 100, 3600, 0, 'downloads'
FROM rows;

VACUUM ANALYZE download_queue;
VACUUM ANALYZE user_setting;
