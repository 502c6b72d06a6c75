-- The data of bench/bench_queue.cpp: 100,000 tasks over 1,000 users (user0 .. user999),
-- 100 each, in every status the library knows, a fifth of unknown size, a third with
-- stored file bytes. It replaces every task of the database it runs in:
--
--   psql -U admin -d download -f bench/queue_data.sql
--
-- Values follow from the task number alone, so every load is the same.
TRUNCATE download_queue RESTART IDENTITY;

INSERT INTO download_queue(username, pid, url, filename, created_time, started_time, status,
                           total_size, current_size, current_rate, total_peers,
                           connected_peers, total_pieces, downloaded_pieces, available_pieces,
                           torrent, upload_rate, total_upload, seeding_ratio,
                           seeding_interval, seeding_elapsed, seeders, leechers, task_flags,
                           destination, extra_info)
SELECT 'user' || (i % 1000),
       CASE WHEN status IN (2, 6, 7, 8) THEN 10000 + i ELSE -1 END,
       'http://mirror' || (i % 50) || '.example.org/pub/file' || i || '.iso',
       'file' || i || '.iso',
       1700000000 + i,
       CASE WHEN status = 1 THEN 0 ELSE 1700000100 + i END,
       status,
       total,
       CASE WHEN status IN (5, 7, 8) THEN total ELSE total * (i % 100) / 100 END,
       CASE WHEN status IN (2, 6) THEN (i * 31) % 4000 * 8 ELSE 0 END,
       i % 60, i % 20, total / 262144, total / 262144 * (i % 100) / 100, total / 262144,
       CASE WHEN i % 3 = 0 THEN decode(repeat('d1', 512), 'hex') END,
       CASE WHEN status IN (7, 8) THEN (i * 17) % 2000 * 8 ELSE 0 END,
       CASE WHEN status IN (7, 8) THEN total / 2 ELSE 0 END,
       100, 86400, CASE WHEN status IN (7, 8) THEN i % 86400 ELSE 0 END,
       i % 40, i % 90,
       CASE WHEN i % 3 = 0 THEN 4 ELSE 0 END,
       'user' || (i % 1000) || '/downloads',
       CASE WHEN i % 3 = 0 THEN 'tracker=http://tracker.example.org/announce' ELSE '' END
FROM (SELECT i,
             (ARRAY[1, 1, 2, 2, 3, 5, 5, 6, 7, 8, 8, 101])[1 + (i * 7) % 12] AS status,
             CASE WHEN i % 5 = 0 THEN 0 ELSE ((i * 7919) % 4000 + 1)::bigint * 1048576 END
                 AS total
      FROM generate_series(1, 100000) AS i) AS g;

ANALYZE download_queue;
