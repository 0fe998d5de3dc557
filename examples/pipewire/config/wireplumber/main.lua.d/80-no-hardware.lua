-- WirePlumber 0.4: the machine's own devices are left alone.
alsa_monitor.enabled = false
v4l2_monitor.enabled = false
libcamera_monitor.enabled = false
