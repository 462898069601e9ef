-- Why recordings ended, by model; 0 is a stop.
select coalesce(m.name, 'chip ' || e.chip_id) as model, e.service, e.end_reason, count(*) as recordings
from quorvel.events e left join quorvel.models m using (chip_id)
group by 1, 2, 3 order by 1, 2, 3 desc;
