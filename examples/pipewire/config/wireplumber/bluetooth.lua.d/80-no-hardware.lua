-- WirePlumber 0.4: the machine's own devices are left alone.
bluez_monitor.enabled = false
