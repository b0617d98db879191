// The run sequence lives here.
