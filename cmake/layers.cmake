# The layer order of the libraries under src/, lowest first. A library may include headers of
# its own layer and of the layers below it, never of a layer above: readers never see
# processors, processors never see jobs.
set(SAR_LAYERS
  "base"
  "dsp metadata io geometry"
  "envisat radarsat doppler"
  "stripmap scansar sarfocuser multilook hostlib"
  "jobs")
