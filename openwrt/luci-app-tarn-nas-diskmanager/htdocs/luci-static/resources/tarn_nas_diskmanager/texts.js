'use strict';
'require baseclass';

/* The words of the ubus object in those of a person. */
return baseclass.extend({
	/* What a reason means, and what to do about it. The last two are the page's own. */
	reasons: {
		not_mounted: [ _('Not mounted, although it should be.'),
			_('The disk manager tries again every few seconds. If it stays like this, the filesystem is damaged or the router cannot read it: have it checked on a computer.') ],
		no_filesystem: [ _('No filesystem that the disk manager knows.'),
			_('Format it on a computer. A disk that was just removed safely looks like this, too: you can unplug it.') ],
		type: [ _('Its type cannot be mounted.'),
			_('Make a partition with a filesystem on it.') ],
		elsewhere: [ _('Mounted by another program.'),
			_('The disk manager leaves it alone.') ],
		gone: [ _('Unplugged.'),
			_('It will be gone from here within seconds.') ],
		not_running: [ _('Not mounted.'),
			_('The disk manager is not running.') ],
		small: [ _('Too small: less than 1000 MiB.'),
			_('Make the partition larger, or mount it by hand.') ],
		removed: [ _('Not in use.'),
			_('It was removed safely, or is being looked at. To use it again, unplug it and plug it in.') ],
		busy: [ _('Still mounted.'),
			_('If it was just plugged in, it is being made ready. If it was to be removed, a program has files open on it: close them and remove it again. Do not unplug it yet.') ],
		full: [ _('No room for it.'),
			_('The disk manager takes 16 disks of 8 partitions each. Unplug a disk, or join partitions.') ],
		name: [ _('Not a kind of disk that is handled.'),
			_('The disk manager takes USB disks and SD cards.') ],
		system: [ _('The router itself runs from it.'),
			_('It is neither shared nor removed.') ],
		settling: [ _('Being looked at.'),
			_('A disk takes some seconds until it is ready.') ],
		unplug: [ _('Removed safely.'),
			_('You can unplug it now. To use it again, unplug it and plug it in.') ]
	},

	/* Why a removal was not begun. */
	errors: {
		not_running: _('The disk manager is not running.'),
		unknown_name: _('The disk is not there any more.'),
		busy: _('The disk manager does not answer. Try again later.')
	}
});
