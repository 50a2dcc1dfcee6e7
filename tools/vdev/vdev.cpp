// The driver model; see vdev.h.
