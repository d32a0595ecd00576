include $(INCLUDE_DIR)/unpack.mk

# What a package does not define itself.
define Build/Prepare
	$(PKG_UNPACK)
endef

# BuildPackage makes three targets of each package: "show-<package>" prints its fields, "install-<package>" runs its
# install section into $(STAGE)/root, and "provides-<package>" then prints the names of the libraries that the package
# may be linked with beside those of its dependencies.
define BuildPackage
$(eval $(call Package/$(1)))
show-$(1): DEPENDS:=$(DEPENDS)
show-$(1):
	@echo "DEPENDS $$(DEPENDS)"
	@echo "CMAKE_OPTIONS $$(subst ",,$$(CMAKE_OPTIONS))"
	@echo "CONFFILES $(strip $(Package/$(1)/conffiles))"
	@echo "SOURCE_URL $$(PKG_SOURCE_URL)"
	@echo "FILE_DEPENDS $$(PKG_FILE_DEPENDS)"

install-$(1):
	$(call Package/$(1)/install,$(STAGE)/root)

provides-$(1):
	@( \
		find $(STAGE)/root -name 'lib*.so*' | sed 's,.*/,,'; \
		$(Package/$(1)/extra_provides) \
	)
endef

prepare:
	mkdir -p $(PKG_BUILD_DIR)
	$(Build/Prepare)
