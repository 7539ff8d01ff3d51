# The protocol of the local connection. A leaf: only platform/ stands on it.
telvane_capnp_library(wire SCHEMAS Wire.capnp)
