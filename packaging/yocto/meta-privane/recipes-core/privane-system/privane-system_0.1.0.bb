# privane-system_0.1.0.bb: the version, and where its source comes from, which the distribution says:
# PRIVANE_SYSTEM_SRC_URI with SRCREV:pn-privane-system, or EXTERNALSRC:pn-privane-system.
require privane-system.inc

PRIVANE_SYSTEM_SRC_URI ?= ""
SRC_URI = "${PRIVANE_SYSTEM_SRC_URI}"
S = "${WORKDIR}/git"

python () {
    if not (d.getVar("EXTERNALSRC") or d.getVar("PRIVANE_SYSTEM_SRC_URI")):
        raise bb.parse.SkipRecipe("its source is named by PRIVANE_SYSTEM_SRC_URI or EXTERNALSRC")
}
