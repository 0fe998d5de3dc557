-- At which volume people listen, by kind of device: each class of volume counts for the time it was heard.
SELECT kind, quantileExactWeighted(0.1)(volume, toUInt64(heard)) AS low,
       quantileExactWeighted(0.5)(volume, toUInt64(heard)) AS median,
       quantileExactWeighted(0.9)(volume, toUInt64(heard)) AS high, sum(volume * heard) / sum(heard) AS mean
FROM (SELECT kind, volume, sum(seconds) AS heard FROM fleet.daily_volumes GROUP BY kind, volume)
GROUP BY kind ORDER BY kind
