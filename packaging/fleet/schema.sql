-- The store of a fleet's metrics: psql -d quorvel -f schema.sql, as the database's owner. PostgreSQL 15.
create schema quorvel;

-- The device description has the chip; this has the name under which it is sold.
create table quorvel.models (
  chip_id bigint primary key,
  name    text not null
);

create table quorvel.events (
  id          uuid primary key,
  device      text not null,
  chip_id     bigint not null,
  time        timestamptz not null,
  service     text not null,
  active_s    bigint not null,
  width       bigint not null,
  height      bigint not null,
  rate        bigint not null,                    -- pictures a second, asked of the screen
  pictures    bigint not null,                    -- that were captured
  dropped     bigint,                             -- of these, that the encoder had no room for; null where not counted
  app_audio   bigint not null,
  microphone  bigint not null,
  bytes       bigint not null,
  end_reason  bigint not null,
  received    timestamptz not null default now(),
  arrivals    integer not null default 1          -- how often the event came; it counts once
);
create index on quorvel.events (time);

-- What came and is no event: of a file that was damaged, or of a form that this store does not know yet.
create table quorvel.refused (
  device   text not null,
  digest   text not null,
  line     text not null,
  reason   text not null,
  received timestamptz not null default now(),
  primary key (device, digest)
);

-- Whatever is wrong with the line is kept with it. Anything else (no room, a server that shuts down) is an error, after which
-- the collector comes again.
create procedure quorvel.take(device text, line text) language plpgsql security definer
  set search_path = pg_catalog, pg_temp as $$
declare
  message jsonb;
  event   jsonb;
  payload jsonb;
begin
  message := line::jsonb;
  event := message -> 'event';
  payload := event -> 'payload';
  insert into quorvel.events as known
    (id, device, chip_id, time, service, active_s, width, height, rate, pictures, dropped, app_audio, microphone, bytes,
     end_reason)
  values
    ((event ->> 'id')::uuid, device, coalesce((message -> 'device' ->> 'chipID')::bigint, 0),
     to_timestamp((event ->> 'time')::double precision), event ->> 'serviceName',
     (payload ->> 'ActiveDuration')::bigint, (payload ->> 'VideoCaptureWidth')::bigint,
     (payload ->> 'VideoCaptureHeight')::bigint, (payload ->> 'VideoCaptureRate')::bigint,
     (payload ->> 'VideoFrameCount')::bigint, (event ->> 'droppedPictures')::bigint,
     (payload ->> 'AppAudioFrameCount')::bigint, (payload ->> 'MicFrameCount')::bigint,
     (payload ->> 'RecordedFileSize')::bigint, (payload ->> 'EndReason')::bigint)
  on conflict (id) do update set arrivals = known.arrivals + 1;
exception when data_exception or integrity_constraint_violation then
  insert into quorvel.refused (device, digest, line, reason) values (device, md5(line), line, sqlerrm)
  on conflict do nothing;
end $$;

-- The collector adds, and can neither read nor change.
create role quorvel_collector login;
revoke all on procedure quorvel.take from public;
grant usage on schema quorvel to quorvel_collector;
grant execute on procedure quorvel.take to quorvel_collector;
