-- SPDX-License-Identifier: Apache-2.0
-- The tables that `veltra-gateway drain` fills. It runs this file at each start; every statement may be repeated.
-- "received" is the time at which the stream took a message; "seq" is the message's place in the stream.
CREATE SCHEMA IF NOT EXISTS veltra;

-- How far each stream has been read: everything up to "seq" is in the tables. "created" tells a stream that was made anew
-- (nanoseconds since 1970).
CREATE TABLE IF NOT EXISTS veltra.position (
  stream text PRIMARY KEY,
  created bigint NOT NULL,
  seq bigint NOT NULL
);

-- The IDs that devices gave their posts. A post whose ID stands here is not written again.
CREATE TABLE IF NOT EXISTS veltra.posts (
  id bytea PRIMARY KEY,
  received timestamptz NOT NULL
);
CREATE INDEX IF NOT EXISTS posts_received ON veltra.posts USING brin (received);

-- One row an event. "fields" is the event as it came; the columns before it are taken from it and are null where it has
-- no such field, or one that the column cannot hold. There is no index on "fields": one would halve the speed of writing.
CREATE TABLE IF NOT EXISTS veltra.events (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  index integer NOT NULL,
  client_id text NOT NULL,
  sender text,
  session_id text,
  session_path text[],
  category integer,
  type integer,
  event_number integer,
  via text,
  happened timestamptz,
  fields jsonb NOT NULL
) PARTITION BY RANGE (received);
CREATE INDEX IF NOT EXISTS events_received ON veltra.events USING brin (received);
CREATE INDEX IF NOT EXISTS events_client ON veltra.events (client_id, received);
CREATE INDEX IF NOT EXISTS events_session ON veltra.events (session_id);

CREATE TABLE IF NOT EXISTS veltra.datagrams (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  device_id text NOT NULL,
  sender text,
  session_id bigint NOT NULL,
  client_version integer NOT NULL,
  category integer NOT NULL,
  type integer NOT NULL,
  event_number integer NOT NULL,
  text text NOT NULL,
  fields jsonb NOT NULL
);
CREATE INDEX IF NOT EXISTS datagrams_received ON veltra.datagrams USING brin (received);
CREATE INDEX IF NOT EXISTS datagrams_device ON veltra.datagrams (device_id, received);

-- "path" is below the drain's folder of files and names a gzip file; "sha256" and "bytes" are those of its content.
CREATE TABLE IF NOT EXISTS veltra.files (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  uuid text NOT NULL,
  sequence bigint NOT NULL,
  filename text NOT NULL,
  description text NOT NULL,
  sha256 bytea NOT NULL,
  bytes bigint NOT NULL,
  path text NOT NULL
);
CREATE INDEX IF NOT EXISTS files_received ON veltra.files (received);

CREATE TABLE IF NOT EXISTS veltra.log_data (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  location text NOT NULL,
  items jsonb NOT NULL
);
CREATE INDEX IF NOT EXISTS log_data_location ON veltra.log_data (location);

-- What gateways refused as malformed: a sample, at most ten a second of each gateway, cut after 64 KiB.
CREATE TABLE IF NOT EXISTS veltra.refused (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  reason text NOT NULL,
  body bytea NOT NULL
);

-- Events are partitioned by days (UTC). The drain calls this for each day before it writes the first event of it.
CREATE OR REPLACE FUNCTION veltra.partition_for(day date) RETURNS void LANGUAGE plpgsql AS $$
BEGIN
  EXECUTE format('CREATE TABLE IF NOT EXISTS veltra.%I PARTITION OF veltra.events FOR VALUES FROM (%L) TO (%L)',
                 'events_' || to_char(day, 'YYYYMMDD'), day || ' 00:00:00+00', (day + 1) || ' 00:00:00+00');
END $$;

-- Retention. Drops whole days of events and deletes the other rows that are older; returns what it dropped. The files of
-- deleted rows stay in their folder, which has a folder for each day.
CREATE OR REPLACE FUNCTION veltra.forget(older_than interval) RETURNS SETOF text LANGUAGE plpgsql AS $$
DECLARE
  part text;
  name text;
BEGIN
  FOR part IN SELECT c.relname FROM pg_inherits i JOIN pg_class c ON c.oid = i.inhrelid
              WHERE i.inhparent = 'veltra.events'::regclass
                AND to_date(right(c.relname, 8), 'YYYYMMDD') + 1 <= (now() - older_than) AT TIME ZONE 'UTC' LOOP
    EXECUTE format('DROP TABLE veltra.%I', part);
    RETURN NEXT part;
  END LOOP;
  FOREACH name IN ARRAY ARRAY['datagrams', 'files', 'log_data', 'refused'] LOOP
    EXECUTE format('DELETE FROM veltra.%I WHERE received < $1', name) USING now() - older_than;
  END LOOP;
END $$;

-- Events of each client type and hour.
CREATE OR REPLACE VIEW veltra.events_by_hour AS
SELECT date_trunc('hour', received) AS hour, sender, count(*) AS events,
       count(DISTINCT session_id) AS sessions, count(DISTINCT client_id) AS clients
FROM veltra.events
GROUP BY 1, 2;

-- Sessions as trees: "path" leads from the root's session to this one, "parent" is the identifier that the one above
-- reports under, and "tree" is the same for all sessions of one family.
CREATE OR REPLACE VIEW veltra.sessions AS
SELECT session_id, session_path[1] AS tree,
       nullif(array_to_string(session_path[1:cardinality(session_path) - 1], '.'), '') AS parent,
       cardinality(session_path) - 1 AS depth, session_path AS path,
       min(client_id) AS client_id, min(sender) AS sender,
       count(*) AS events, min(received) AS first_received, max(received) AS last_received,
       bool_or(category = 0 AND type = 0) AS started, bool_or(category = 0 AND type = 1) AS stopped
FROM veltra.events
WHERE session_id IS NOT NULL
GROUP BY session_id, session_path;

-- The share of sessions that report, as their stop messages tell it: a session reports if a number drawn from 0 to 1 is
-- at most its threshold. "expected" is how many sessions there were for those that reported; null where a
-- threshold is missing.
CREATE OR REPLACE VIEW veltra.sampled AS
SELECT date_trunc('day', received) AS day, sender, via,
       count(*) AS sessions,
       avg(least(threshold, 1)) AS share,
       sum(1 / nullif(least(threshold, 1), 0)) AS expected
FROM (SELECT received, sender, via,
             CASE WHEN jsonb_typeof(fields->'SamplingThreshold') = 'number'
                       AND (fields->>'SamplingThreshold')::numeric >= 0
                  THEN (fields->>'SamplingThreshold')::numeric END AS threshold
      FROM veltra.events WHERE category = 0 AND type = 1) AS stops
GROUP BY 1, 2, 3;

-- Loss as the fleet sees it: a session's back end numbers its events from 1, so numbers that are missing below the highest
-- one did not arrive, or not yet. Numbers start again after 65,535.
CREATE OR REPLACE VIEW veltra.gaps AS
SELECT session_id, via, min(client_id) AS client_id, min(sender) AS sender,
       max(event_number) AS highest, count(DISTINCT event_number) AS arrived,
       max(event_number) - count(DISTINCT event_number) AS missing
FROM veltra.events
WHERE session_id IS NOT NULL AND event_number >= 1
GROUP BY session_id, via
HAVING max(event_number) > count(DISTINCT event_number);

-- Which storebags are in use and how a rollout spreads. An event does not say which storebag it comes from; an operator
-- writes a label into the "post_url" of each version ("https://…/events/v42"), which is "via". "library" is the version of the
-- client library.
CREATE OR REPLACE VIEW veltra.storebag_versions AS
SELECT date_trunc('hour', received) AS hour, via, fields->>'_reportVers' AS library, sender,
       count(DISTINCT client_id) AS clients, count(DISTINCT session_id) AS sessions, count(*) AS events
FROM veltra.events
GROUP BY 1, 2, 3, 4;
