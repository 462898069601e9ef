-- Recordings by model. Missing: what was asked of the screen and not captured; the seconds are rounded, so that single short
-- recordings say little of it.
select coalesce(m.name, 'chip ' || e.chip_id) as model,
       count(distinct e.device) as devices,
       count(*) as recordings,
       sum(e.active_s) as seconds,
       sum(e.pictures) as pictures,
       greatest(sum(e.rate * e.active_s) - sum(e.pictures), 0) as missing,
       coalesce(sum(e.dropped), 0) as dropped,
       count(*) filter (where e.end_reason <> 0) as failed,
       round(sum(e.bytes) / 1e6, 1) as megabytes
from quorvel.events e left join quorvel.models m using (chip_id)
group by 1 order by 1;
