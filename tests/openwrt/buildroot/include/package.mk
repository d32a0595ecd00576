# BuildPackage makes two targets of each package: "show-<package>" prints its fields, "install-<package>" runs its
# install section into $(STAGE)/root.
define BuildPackage
$(eval $(call Package/$(1)))
show-$(1): DEPENDS:=$(DEPENDS)
show-$(1):
	@echo "DEPENDS $$(DEPENDS)"
	@echo "CMAKE_OPTIONS $$(subst ",,$$(CMAKE_OPTIONS))"
	@echo "CONFFILES $(strip $(Package/$(1)/conffiles))"
	@echo "SOURCE_URL $$(PKG_SOURCE_URL)"

install-$(1):
	$(call Package/$(1)/install,$(STAGE)/root)
endef

prepare:
	$(Build/Prepare)
