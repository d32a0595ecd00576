# How a source archive is unpacked. All is set anew here, whatever the package has set before it included this.
ifneq ($(PKG_SOURCE),)
TAR_OPTIONS:=-xf -
TAR_CMD=$(HOST_TAR) -C $(1)/.. $(TAR_OPTIONS)
PKG_UNPACK=xzcat $(DL_DIR)/$(PKG_SOURCE) | $(call TAR_CMD,$(PKG_BUILD_DIR))
endif
