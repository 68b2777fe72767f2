# classes/privane-image.bbclass: what an image with privane-system needs beside its packages.

# The service does not keep it in step with the group file, so a device has none.
privane_remove_gshadow() {
    rm -f "${IMAGE_ROOTFS}${sysconfdir}/gshadow" "${IMAGE_ROOTFS}${sysconfdir}/gshadow-"
}
ROOTFS_POSTPROCESS_COMMAND += "privane_remove_gshadow"
