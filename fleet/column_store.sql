-- SPDX-License-Identifier: Apache-2.0
-- The events in a column store (ClickHouse), beside PostgreSQL: for questions that read few columns of very many rows. What is
-- written twice is merged, because a row is named by (received, seq, index): at least once is enough. To carry over what is new,
-- from cron:
--
--   LAST=$(clickhouse-client --query 'SELECT toUInt32(max(received)) FROM veltra.events')
--   psql -qAt -c "COPY (SELECT to_char(received AT TIME ZONE 'UTC', 'YYYY-MM-DD HH24:MI:SS'), seq, index, client_id, coalesce(sender, ''),
--       coalesce(session_id, ''), coalesce(category, -1), coalesce(type, -1), coalesce(event_number, -1), coalesce(via, ''),
--       to_char(happened AT TIME ZONE 'UTC', 'YYYY-MM-DD HH24:MI:SS'), fields
--       FROM veltra.events WHERE received >= to_timestamp($LAST) - interval '10 minutes') TO STDOUT (FORMAT csv, NULL '\N')" |
--     clickhouse-client --query 'INSERT INTO veltra.events FORMAT CSV'
--
-- The ten minutes are for the stream's servers: their clocks differ, and one takes the place of another. An event without a number
-- has -1 there. Count with FINAL, or after OPTIMIZE.
CREATE DATABASE IF NOT EXISTS veltra;
CREATE TABLE IF NOT EXISTS veltra.events (
  received DateTime('UTC'),
  seq UInt64,
  index UInt32,
  client_id String,
  sender String,
  session_id String,
  category Int32,
  type Int32,
  event_number Int32,
  via String,
  happened Nullable(DateTime('UTC')),
  fields String
) ENGINE = ReplacingMergeTree() PARTITION BY toYYYYMM(received) ORDER BY (sender, category, type, received, seq, index);
