-- SPDX-License-Identifier: Apache-2.0
-- The tables that `veltra-gateway drain` fills. It runs this file at its start, unless the schema's comment says that it has done
-- so; every statement may be repeated.
-- "received" is the time at which the stream took a message; "seq" is the message's place in the stream.
CREATE SCHEMA IF NOT EXISTS veltra;

-- How far each stream has been read: everything up to "seq" is in the tables. "created" tells a stream that was made anew
-- (nanoseconds since 1970), "time" is that of the message at "seq": a stream that has lost its newest messages gives other ones
-- their places.
CREATE TABLE IF NOT EXISTS veltra.position (
  stream text PRIMARY KEY,
  created bigint NOT NULL,
  seq bigint NOT NULL,
  time bigint NOT NULL DEFAULT 0
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
-- A condition on a view's hour or day finds here which parts of which days it needs.
CREATE INDEX IF NOT EXISTS events_received ON veltra.events USING brin (received,
  date_bin('1 hour', received, '2000-01-01 00:00+00'), date_bin('1 day', received, '2000-01-01 00:00+00')) WITH (autosummarize = on);
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

-- What gateways refused as malformed: a sample, at most ten a second of each gateway, cut after 64 KiB. The drain keeps it for
-- seven days.
CREATE TABLE IF NOT EXISTS veltra.refused (
  received timestamptz NOT NULL,
  seq bigint NOT NULL,
  reason text NOT NULL,
  body bytea NOT NULL
);

-- Events are partitioned by days (UTC). The drain calls this for each day before it writes the first event of it. A table that is
-- attached, unlike one that is made as a partition, does not wait for queries of the others.
CREATE OR REPLACE FUNCTION veltra.partition_for(day date) RETURNS void LANGUAGE plpgsql AS $$
DECLARE
  part text := 'events_' || to_char(day, 'YYYYMMDD');
BEGIN
  IF to_regclass('veltra.' || part) IS NOT NULL THEN
    RETURN;
  END IF;
  EXECUTE format('CREATE TABLE veltra.%I (LIKE veltra.events INCLUDING ALL)', part);
  EXECUTE format('ALTER TABLE veltra.events ATTACH PARTITION veltra.%I FOR VALUES FROM (%L) TO (%L)',
                 part, day || ' 00:00:00+00', (day + 1) || ' 00:00:00+00');
END $$;

-- Retention. Deletes rows that are older and drops whole days of events; returns what it dropped. A day that a query keeps from
-- being dropped for three seconds stays until the next time. The drain
-- removes the files of deleted rows with --keep-days alone; there is a folder for each day.
CREATE OR REPLACE FUNCTION veltra.forget(older_than interval) RETURNS SETOF text LANGUAGE plpgsql AS $$
DECLARE
  part text;
  name text;
BEGIN
  FOREACH name IN ARRAY ARRAY['datagrams', 'files', 'log_data', 'refused'] LOOP
    EXECUTE format('DELETE FROM veltra.%I WHERE received < $1', name) USING now() - older_than;
  END LOOP;
  PERFORM set_config('lock_timeout', '3s', true);
  FOR part IN SELECT c.relname FROM pg_inherits i JOIN pg_class c ON c.oid = i.inhrelid
              WHERE i.inhparent = 'veltra.events'::regclass
                AND to_date(right(c.relname, 8), 'YYYYMMDD') + 1 <= (now() - older_than) AT TIME ZONE 'UTC' LOOP
    BEGIN
      EXECUTE format('DROP TABLE veltra.%I', part);
      RETURN NEXT part;
    EXCEPTION WHEN lock_not_available THEN
      NULL;
    END;
  END LOOP;
END $$;

-- The views. Hours and days are those of UTC, whatever time zone a session of the database has. A condition on "hour" or "day"
-- reads those alone, and of other days their last megabyte and what autovacuum has not yet seen. A null stands for what an event does not say.

-- Events of each client type and hour. Sessions and clients of an hour count once in it.
CREATE OR REPLACE VIEW veltra.events_by_hour AS
SELECT date_bin('1 hour', received, '2000-01-01 00:00+00') AS hour, sender, count(*) AS events,
       count(DISTINCT client_id || '/' || session_id) AS sessions, count(DISTINCT client_id) AS clients
FROM veltra.events
GROUP BY 1, 2;

-- Sessions as trees: one row for each session, or for each client of it if the client's identifier has changed. "path" leads
-- from the root's session to this one, "parent" is the identifier that the one above reports under, null for a root, and
-- "tree" is the same for all sessions of one family.
CREATE OR REPLACE VIEW veltra.sessions AS
SELECT session_id, session_path[1] AS tree,
       nullif(array_to_string(session_path[1:cardinality(session_path) - 1], '.'), '') AS parent,
       cardinality(session_path) - 1 AS depth, session_path AS path,
       client_id, min(sender) AS sender,
       count(*) AS events, min(received) AS first_received, max(received) AS last_received,
       coalesce(bool_or(category = 0 AND type = 0), false) AS started,
       coalesce(bool_or(category = 0 AND type = 1), false) AS stopped
FROM veltra.events
WHERE session_id IS NOT NULL
GROUP BY client_id, session_id, session_path;

-- The share of sessions that report, as their stop messages tell it. A session reports if a number drawn from 0 to 1 is at
-- most its threshold, so one that reports with the threshold 0.1 stands for ten; without a threshold (-1) all report.
-- "expected" is how many there were for those that reported. It is null if some stop message does not say its threshold, or says
-- 0, with which only messages that override sampling report; "share" is then that of the others.
CREATE OR REPLACE VIEW veltra.sampled AS
SELECT date_bin('1 day', received, '2000-01-01 00:00+00') AS day, sender, via,
       count(*) AS sessions,
       round(count(stands_for) / sum(stands_for), 4) AS share,
       CASE WHEN count(stands_for) = count(*) THEN round(sum(stands_for), 1) END AS expected
FROM (SELECT received, sender, via,
             CASE WHEN threshold < 0 OR threshold > 1 THEN 1 ELSE 1 / nullif(threshold, 0) END AS stands_for
      FROM (SELECT received, sender, via,
                   CASE WHEN jsonb_typeof(fields->'SamplingThreshold') = 'number'
                        THEN (fields->>'SamplingThreshold')::numeric END AS threshold
            FROM veltra.events WHERE category = 0 AND type = 1) AS stops) AS weighed
GROUP BY 1, 2, 3;

-- Loss as the fleet sees it. A session's back end numbers its messages from 1, and after 65,535 from 0, also over a change of
-- storebags. What is missing below the highest number was lost, is still on its way, or was never meant to leave: a back end
-- that does not report numbers its messages as well. "via" is the back end: the label without its version ("main" of
-- "main-v42"). Two back ends of a session that have the same label, or none, hide each other's loss, and so does a hole of more than
-- 32,767 numbers. Of a session that began before the first day that is kept, what is missing before its first event is not counted.
CREATE OR REPLACE VIEW veltra.gaps AS
WITH kept AS (
  SELECT extract(epoch FROM min(to_date(right(inhrelid::regclass::text, 8), 'YYYYMMDD'))) AS since
  FROM pg_inherits WHERE inhparent = 'veltra.events'::regclass
), numbered AS (
  -- On some internal builds a session is the client's number, which comes again: its start tells them apart.
  SELECT client_id, session_id, nullif(regexp_replace(via, '(^|-)v[0-9]+$', ''), '') AS backend,
         CASE WHEN jsonb_typeof(fields->'_startTS') = 'number' THEN (fields->>'_startTS')::numeric END AS began,
         sender, received, seq, index, event_number
  FROM veltra.events
  WHERE session_id IS NOT NULL AND event_number BETWEEN 0 AND 65535
), stepped AS (
  -- From one arrival to the next, forwards or, of what comes late, backwards: the shorter way around.
  SELECT *, (event_number - lag(event_number) OVER arrival + 98304) % 65536 - 32768 AS step
  FROM numbered
  WINDOW arrival AS (PARTITION BY client_id, session_id, backend, began ORDER BY received, seq, index)
), placed AS (
  -- The number as if it went on after 65,535.
  SELECT *, first_value(event_number) OVER arrival + coalesce(sum(step) OVER arrival, 0) AS place
  FROM stepped
  WINDOW arrival AS (PARTITION BY client_id, session_id, backend, began ORDER BY received, seq, index)
), counted AS (
  SELECT session_id, backend AS via, client_id, min(sender) AS sender,
         max(place)::integer AS highest, count(DISTINCT place) AS arrived,
         max(place) - count(DISTINCT place)
           - CASE WHEN began >= (SELECT since FROM kept) THEN 0 ELSE min(place) - 1 END AS missing,
         max(received) AS last_received
  FROM placed
  GROUP BY client_id, session_id, backend, began
)
SELECT * FROM counted WHERE missing > 0;

-- Which storebags are in use and how a rollout spreads. An event does not say which storebag it comes from; an operator
-- writes a label with a version into the "post_url" of each ("https://…/events/main-v42"), which is "via". "library" is the version
-- of the client library. A client that changes within an hour counts with both versions.
CREATE OR REPLACE VIEW veltra.storebag_versions AS
SELECT date_bin('1 hour', received, '2000-01-01 00:00+00') AS hour, via, fields->>'_reportVers' AS library, sender,
       count(DISTINCT client_id) AS clients, count(DISTINCT client_id || '/' || session_id) AS sessions, count(*) AS events
FROM veltra.events
GROUP BY 1, 2, 3, 4;
