-- Which release made headphones louder: the share of headphones' time above three quarters of the volume, and the mean
-- volume, by kind of device and release.
SELECT kind, release, sum(if(volume > 0.75, seconds, 0)) / sum(seconds) AS loud_share,
       sum(volume * seconds) / sum(seconds) AS mean_volume
FROM fleet.daily_volumes
WHERE route = 'Headphones'
GROUP BY kind, release ORDER BY kind, release
