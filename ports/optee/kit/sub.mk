# The trusted application's own code comes as one object (LDADD); the kit compiles its header.
global-incdirs-y += .
