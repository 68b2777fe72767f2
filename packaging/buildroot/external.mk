# external.mk: the packages of this external tree.
include $(sort $(wildcard $(BR2_EXTERNAL_PRIVANE_PATH)/package/*/*.mk))
