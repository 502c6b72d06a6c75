-- The download database. Applying this file again changes nothing.
-- Times are seconds since the epoch in 32-bit integers; booleans read back as 't'/'f'.
-- No foreign keys: removing a feed leaves its items and filters alone.

CREATE TABLE IF NOT EXISTS download_queue (
    task_id           serial PRIMARY KEY,
    username          text,
    pid               integer,
    url               text,
    filename          text,
    created_time      integer,
    started_time      integer,
    status            integer,
    total_size        bigint,
    current_size      bigint,
    current_rate      integer,
    total_peers       integer,
    connected_peers   integer,
    total_pieces      integer,
    downloaded_pieces integer,
    available_pieces  integer,
    torrent           bytea,
    upload_rate       integer,
    total_upload      bigint,
    seeding_ratio     integer,
    seeding_interval  integer,
    seeding_elapsed   integer,
    seeders           integer NOT NULL DEFAULT 0,
    leechers          integer NOT NULL DEFAULT 0,
    task_flags        integer NOT NULL DEFAULT 0,
    destination       text,
    extra_info        text
);

-- Next-task selection: the waiting rows that no worker holds, oldest first.
CREATE INDEX IF NOT EXISTS download_queue_waiting_idx
    ON download_queue (task_id) WHERE status = 1 AND pid = -1;
-- The rotation among users: the first waiting row after (or before) a user, in the
-- order of lower(username) then task_id, is one index probe instead of a sort of every
-- waiting row.
CREATE INDEX IF NOT EXISTS download_queue_waiting_user_idx
    ON download_queue (lower(username), task_id) WHERE status = 1 AND pid = -1;
-- Per-user statements compare lower(username).
CREATE INDEX IF NOT EXISTS download_queue_user_idx ON download_queue (lower(username));
-- Counts and sweeps by status (downloading, seeding, paused, errors).
CREATE INDEX IF NOT EXISTS download_queue_status_idx ON download_queue (status);
-- Listings of the whole queue ordered by owner read a page from here instead of
-- sorting every task (ties by task id are sorted within each owner's group). The name
-- is never updated, so the daemon's frequent progress writes do not touch this index.
CREATE INDEX IF NOT EXISTS download_queue_username_idx ON download_queue (username);

CREATE TABLE IF NOT EXISTS user_setting (
    username            text NOT NULL,
    uid                 integer,
    share_folder        text NOT NULL DEFAULT '',
    user_disabled       boolean NOT NULL DEFAULT false,
    enable_watchffolder boolean NOT NULL DEFAULT false,
    delete_watchtorrent boolean NOT NULL DEFAULT false,
    watchfolder         text NOT NULL DEFAULT ''
);

-- One settings row per user, whatever the letter case of the name.
CREATE UNIQUE INDEX IF NOT EXISTS user_setting_user_idx ON user_setting (lower(username));

CREATE TABLE IF NOT EXISTS sysconf (
    download_enabled integer,
    download_when    text,
    download_order   integer,
    seeding_ratio    integer,
    seeding_interval integer
);

CREATE TABLE IF NOT EXISTS rss_feed (
    id          serial PRIMARY KEY,
    url         text,
    username    text,
    title       text NOT NULL DEFAULT '',
    last_update integer NOT NULL DEFAULT 0,
    is_updating boolean NOT NULL DEFAULT false
);

CREATE INDEX IF NOT EXISTS rss_feed_user_idx ON rss_feed (username);

CREATE TABLE IF NOT EXISTS rss_item (
    id      serial PRIMARY KEY,
    feed_id integer,
    title   text,
    url     text,
    link    text,
    date    integer,
    size    bigint,
    is_new  boolean NOT NULL DEFAULT true
);

CREATE INDEX IF NOT EXISTS rss_item_feed_url_idx ON rss_item (feed_id, url);
CREATE INDEX IF NOT EXISTS rss_item_feed_date_idx ON rss_item (feed_id, date);

CREATE TABLE IF NOT EXISTS rss_filter (
    id          serial PRIMARY KEY,
    feed_id     integer,
    name        text,
    match       text,
    not_match   text,
    destination text,
    enable      boolean NOT NULL DEFAULT true
);

CREATE INDEX IF NOT EXISTS rss_filter_feed_idx ON rss_filter (feed_id);
