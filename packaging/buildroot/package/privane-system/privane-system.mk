################################################################################
#
# privane-system
#
################################################################################

PRIVANE_SYSTEM_VERSION = 0.1.0
PRIVANE_SYSTEM_SITE = $(call qstrip,$(BR2_PACKAGE_PRIVANE_SYSTEM_SOURCE))
PRIVANE_SYSTEM_SITE_METHOD = local
# What was built in the tree is not its source.
PRIVANE_SYSTEM_OVERRIDE_SRCDIR_RSYNC_EXCLUSIONS = --exclude '/build*'
# There is no licence yet; its owners decide on one.
PRIVANE_SYSTEM_LICENSE = PROPRIETARY
PRIVANE_SYSTEM_REDISTRIBUTE = NO
# For who replaces a platform library, and who makes a binding of the interface document.
PRIVANE_SYSTEM_INSTALL_STAGING = YES

PRIVANE_SYSTEM_DEPENDENCIES = \
	host-libglib2 \
	host-pkgconf \
	json-glib \
	libglib2 \
	libubootenv \
	libxcrypt \
	zlib

# Warnings are errors for who works on the source; a compiler of another age has others.
PRIVANE_SYSTEM_CONF_OPTS = \
	-Dwerror=false \
	-Dsystemd_unit_dir=/usr/lib/systemd/system \
	-Dsysusers_dir=/usr/lib/sysusers.d \
	-Dauthz_deadline_ms=$(BR2_PACKAGE_PRIVANE_SYSTEM_AUTHZ_DEADLINE_MS) \
	-Dbus_message_limit=$(BR2_PACKAGE_PRIVANE_SYSTEM_BUS_MESSAGE_LIMIT) \
	-Daccount_loss_marker=$(BR2_PACKAGE_PRIVANE_SYSTEM_ACCOUNT_LOSS_MARKER) \
	-Dclient=$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_CLIENT),true,false) \
	-Ddocs=$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_DOCS),true,false) \
	-Dhardening=$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_HARDENING),true,false)

ifeq ($(BR2_PACKAGE_PRIVANE_SYSTEM_AUTHZ_POLKIT),y)
PRIVANE_SYSTEM_CONF_OPTS += -Dauthz=polkit
else ifeq ($(BR2_PACKAGE_PRIVANE_SYSTEM_AUTHZ_POLICY_FILE),y)
PRIVANE_SYSTEM_CONF_OPTS += \
	-Dauthz=policy-file \
	-Dauthz_policy_file=$(BR2_PACKAGE_PRIVANE_SYSTEM_AUTHZ_POLICY_FILE_PATH)
endif

PRIVANE_SYSTEM_REPLACED_LIBRARIES = \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBAUTHZ),,libauthz) \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBBOOTPARAM),,libbootparam) \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBDIGESTENTRY),,libdigestentry) \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBLOGBACKEND),,liblogbackend) \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBPARAMCLI),,libparamcli) \
	$(if $(BR2_PACKAGE_PRIVANE_SYSTEM_LIBRTCCLOCK),,librtcclock)

# The package that brings another one depends on this package, and so comes after it.
define PRIVANE_SYSTEM_REMOVE_REPLACED_LIBRARIES
	$(foreach library,$(PRIVANE_SYSTEM_REPLACED_LIBRARIES),rm $(TARGET_DIR)/usr/lib/$(library).so*$(sep))
endef
PRIVANE_SYSTEM_POST_INSTALL_TARGET_HOOKS += PRIVANE_SYSTEM_REMOVE_REPLACED_LIBRARIES

# The bus policy names the group, so it is in the image before anything is started; the sysusers file
# finds it there.
define PRIVANE_SYSTEM_USERS
	- - privane $(BR2_PACKAGE_PRIVANE_SYSTEM_GID) - - - - Callers of the privileged service
endef

$(eval $(meson-package))
