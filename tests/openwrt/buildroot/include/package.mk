include $(INCLUDE_DIR)/unpack.mk

# What a package does not define itself.
define Build/Prepare
	$(PKG_UNPACK)
endef

PKG_FLAGS_KNOWN:=no-iremap no-mips16 gc-sections no-gc-sections lto no-lto no-mold
ifneq ($(filter-out $(PKG_FLAGS_KNOWN),$(PKG_BUILD_FLAGS)),)
  $(error unknown PKG_BUILD_FLAGS)
endif

# BuildPackage makes three targets of each package: "show-<package>" prints its fields, "install-<package>" runs its
# install section into $(STAGE)/root and lists what a firmware upgrade has to keep beside the package's own files, and
# "provides-<package>" then prints the names of the libraries that the package may be linked with beside those of its
# dependencies.
define BuildPackage
$(eval $(call Package/$(1)))
KEEP_$(1):=$(strip $(call Package/$(1)/conffiles))

show-$(1): DEPENDS:=$(DEPENDS)
show-$(1): URL:=$(URL)
show-$(1):
	@echo "DEPENDS $$(DEPENDS)"
	@echo "CMAKE_OPTIONS $$(subst ",,$$(CMAKE_OPTIONS))"
	@echo "CONFFILES $$(KEEP_$(1))"
	@echo "SOURCE $$(PKG_SOURCE)"
	@echo "SOURCE_URL $$(PKG_SOURCE_URL)"
	@echo "HASH $$(PKG_HASH)"
	@echo "FILE_DEPENDS $$(PKG_FILE_DEPENDS)"
	@echo "MAINTAINER $$(PKG_MAINTAINER)"
	@echo "URL $$(URL)"

install-$(1):
	$(call Package/$(1)/install,$(STAGE)/root)
	for kept in $$(KEEP_$(1)); do \
		[ -f $(STAGE)/root$$$$kept ] || { \
			mkdir -p $(STAGE)/root/lib/upgrade/keep.d && echo $$$$kept >>$(STAGE)/root/lib/upgrade/keep.d/$(1); \
		}; \
	done

provides-$(1):
	@( \
		find $(STAGE)/root -name 'lib*.so*' | sed 's,.*/,,'; \
		$(Package/$(1)/extra_provides) \
	)
endef

prepare:
	mkdir -p $(PKG_BUILD_DIR)
	$(Build/Prepare)
